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
    /// Notes the descriptors of a message that is about to be handed to sd-bus. `socket` is the connection's.
    void sending(const MessageAppending& size, int socket);
    /// Notes the message that was handed over, and how many wait now.
    void sent(const MessageAppending& size, std::uint64_t waiting, const HeldBytes::Peer& peer);
    /// Notes how many messages wait now.
    void update(std::uint64_t waiting, const HeldBytes::Peer& peer);
    bool isEmpty() const { return waiting_ == nullptr; }
    /// Forgets what waits, at the end of the connection.
    void clear() { waiting_.reset(); }
    /// Why the peer is not worth waiting for, or empty.
    std::string excess(const IpcLimits& limits) const;

private:
    struct Waiting {
        explicit Waiting(const HeldBytes::Peer& peer) : held(peer) {}
        void shrinkTo(std::uint64_t waiting);

        HeldBytes::Claim held;
        bool tooMuchHeld = false;
        std::uint64_t count = 0;
        /// Of those that were sent here; others are sd-bus's own.
        std::list<std::size_t> sizes;
        std::size_t bytes = 0;
    };

    /// Null mostly: peers read what they are sent.
    std::unique_ptr<Waiting> waiting_;
    std::size_t unreadDescriptors_ = 0;
};

}  // namespace typhon
