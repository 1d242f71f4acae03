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
    /// Where messages come from, and what may come from there.
    struct Source {
        /// Does not block.
        int socket;
        std::size_t maximumBytes;
        /// Of a message that is put together here.
        std::size_t maximumDescriptors;
        HeldBytes::Peer peer;
    };
    enum class Outcome {
        /// There is nothing to read.
        nothing,
        /// sd-bus may read: it gets exactly one message.
        ready,
        /// The same, and something lies behind it.
        readyAmongOthers,
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

    /// Looks at the input, or reads more of the message that has begun.
    Outcome next(const Source& source);
    /// The message that was put together, or nothing of the one that has begun: it is forgotten.
    ReceivedMessage take();
    /// Of the message that was put together, and of the files that came with it.
    std::size_t assembledBytes() const;

private:
    struct Unfinished {
        explicit Unfinished(const HeldBytes::Peer& peer) : held(peer) {}

        HeldBytes::Claim held;
        /// Zero until the header is there.
        std::uint64_t size = 0;
        ReceivedMessage message;
    };

    Outcome assemble(const Source& source);
    Outcome checkSize(const Source& source);
    Outcome readMore(const Source& source);
    bool keepDescriptors(msghdr& message, std::size_t maximum);

    /// The message that has begun. Null mostly.
    std::unique_ptr<Unfinished> unfinished_;
};

}  // namespace typhon
