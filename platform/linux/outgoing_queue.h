#pragma once

#include "platform/linux/bus_message_codec.h"
#include "platform/linux/ipc_limits.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>

namespace typhon {

/// Follows what a peer leaves unread: the messages that wait in sd-bus because the socket is full, and the
/// descriptors on their way. The caller locks.
class OutgoingQueue {
public:
    /// Notes a message that is about to be handed to sd-bus. `socket` is the connection's.
    void sending(const MessageAppending& size, int socket);
    /// Notes how many messages wait now.
    void update(std::uint64_t waiting);
    bool isEmpty() const { return waiting_ == 0; }
    /// Why the peer is not worth waiting for, or empty.
    std::string excess(const IpcLimits& limits) const;

private:
    std::uint64_t waiting_ = 0;
    /// Sizes of the latest messages, at least of those that wait and were sent here.
    std::deque<std::size_t> sizes_;
    std::size_t bytes_ = 0;
    std::size_t unreadDescriptors_ = 0;
};

}  // namespace typhon
