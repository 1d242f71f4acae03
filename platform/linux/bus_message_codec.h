#pragma once

#include "platform/ipc.h"

#include <cstddef>
#include <optional>
#include <string>

#include <systemd/sd-bus.h>

namespace typhon {

/// What one incoming message may cost. Whatever goes beyond makes its arguments invalid.
struct MessageLimits {
    /// Values in all, nested ones and keys included.
    std::size_t values = 1U << 20;
    /// Containers nested in each other.
    std::size_t depth = 64;
    /// Text and data outside of memory files.
    std::size_t bytes = 16U << 20;
    /// Descriptors, memory files included.
    std::size_t descriptors = 16;
    /// Contents of all its memory files.
    std::size_t memoryFileBytes = 64U << 20;
    /// Values in one memory file.
    std::size_t memoryFileValues = 4U << 20;
};

/// The outcome of reading a message.
struct MessageReading {
    /// Null when the message does not fit its types or the limits.
    std::optional<Arguments> arguments;
    /// About how much memory the arguments take, in bytes.
    std::size_t memory = 0;
};

/// As `readArguments`, with limits. The caller locks the bus.
MessageReading readMessage(sd_bus_message* message, const std::string& types,
                           const std::optional<AuditToken>& sender, const MessageLimits& limits);

/// The outcome of filling a message.
struct MessageAppending {
    /// Zero, or a negative errno.
    int result = 0;
    /// About how many bytes the body takes.
    std::size_t bytes = 0;
    std::size_t descriptors = 0;
};

/// As `appendArguments`, and tells the size. The caller locks the bus.
MessageAppending appendMessage(sd_bus_message* message, const std::string& types, const Arguments& arguments,
                               bool descriptorsAllowed);

}  // namespace typhon
