#pragma once

#include <cstddef>

namespace typhon {

/// Bounds how much is read of one incoming message, which sd-bus itself does only at 128 MiB. Where a message
/// begins its size is looked up in its header without taking anything off the socket. Of a message whose
/// beginning could not be seen (the first after the handshake, one whose header comes in pieces) the bytes
/// are counted that wait before each reading; what comes during a reading escapes, up to sd-bus's own bound.
/// The caller locks.
class MessageSizeGuard {
public:
    explicit MessageSizeGuard(std::size_t limit) : limit_(limit) {}

    /// Before sd-bus reads from `socket`: false when the message that begins there is too large.
    bool admits(int socket);
    /// After sd-bus has read: whether it has got a whole message, and whether it may have read ahead. False
    /// when more has been read of one message than is allowed.
    bool hasRead(bool wholeMessage, bool maybeAhead);

private:
    enum class Position { unknown, boundary, withinKnown };

    const std::size_t limit_;
    Position position_ = Position::unknown;
    bool sawHeader_ = false;
    std::size_t waiting_ = 0;
    std::size_t partial_ = 0;
};

}  // namespace typhon
