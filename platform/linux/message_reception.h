#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/held_bytes.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include <sys/socket.h>

namespace typhon {

/// A message as it travelled.
struct ReceivedMessage {
    std::vector<std::uint8_t> bytes;
    std::vector<FileDescriptor> descriptors;
};

/// Bounds what is read of incoming messages. sd-bus reads as much as a message claims to have, 128 MiB, and
/// as many descriptors as come with it, and keeps that for as long as the rest stays away. So it gets to read
/// only messages that lie in the socket as a whole, come without descriptors and are plainly valid. Others,
/// the large ones, the odd ones and those that come in pieces, are put together here, within limits. The
/// caller locks.
class MessageReception {
public:
    struct Limits {
        std::size_t bytes;
        /// Of a message that is put together here.
        std::size_t descriptors;
    };
    enum class Outcome {
        /// There is nothing to read.
        nothing,
        /// sd-bus may read: it gets exactly one message.
        ready,
        /// A message was put together: `take` it.
        assembled,
        /// A message has begun, its rest is yet to come.
        begun,
        // Ends of the connection.
        closed,
        malformed,
        tooLarge,
        tooManyDescriptors,
        /// The peer makes us hold too many parts of messages.
        tooMuchHeld,
    };

    MessageReception(Limits limits, std::unique_ptr<HeldBytes::Claim> held)
        : limits_(limits), held_(std::move(held))
    {}

    /// Looks at the input of `socket`, which does not block, or reads more of the message that has begun.
    Outcome next(int socket);
    ReceivedMessage take();
    /// Of the message that was put together, and of the files that came with it.
    std::size_t assembledBytes() const;
    void allowDescriptors(bool allowed) { descriptorsAllowed_ = allowed; }

private:
    Outcome look(int socket);
    Outcome assemble(int socket);
    Outcome checkSize();
    Outcome readMore(int socket);
    bool keepDescriptors(msghdr& message);

    const Limits limits_;
    const std::unique_ptr<HeldBytes::Claim> held_;
    bool descriptorsAllowed_ = true;
    bool begun_ = false;
    /// Of the message that has begun, once its header is there.
    std::uint64_t size_ = 0;
    ReceivedMessage message_;
};

}  // namespace typhon
