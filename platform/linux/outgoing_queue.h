#pragma once

#include "platform/linux/bus_message_codec.h"
#include "platform/linux/held_bytes.h"
#include "platform/linux/ipc_limits.h"

#include <cstddef>
#include <cstdint>
#include <list>
#include <memory>
#include <string>
#include <utility>

namespace typhon {

/// Follows what a peer leaves unread: the messages that wait in sd-bus because the socket is full, and the
/// descriptors on their way. The caller locks.
class OutgoingQueue {
public:
    explicit OutgoingQueue(std::unique_ptr<HeldBytes::Claim> held) : held_(std::move(held)) {}
    /// Notes a message that is about to be handed to sd-bus. `socket` is the connection's.
    void sending(const MessageAppending& size, int socket);
    /// Notes how many messages wait now.
    void update(std::uint64_t waiting);
    bool isEmpty() const { return waiting_ == 0; }
    /// Forgets everything, at the end of the connection.
    void clear();
    /// Why the peer is not worth waiting for, or empty.
    std::string excess(const IpcLimits& limits) const;

private:
    const std::unique_ptr<HeldBytes::Claim> held_;
    bool tooMuchHeld_ = false;
    std::uint64_t waiting_ = 0;
    /// Sizes of the latest messages, at least of those that wait and were sent here.
    std::list<std::size_t> sizes_;
    std::size_t bytes_ = 0;
    std::size_t unreadDescriptors_ = 0;
};

}  // namespace typhon
