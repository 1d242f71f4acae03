#include "platform/linux/outgoing_queue.h"

#include <linux/sockios.h>
#include <sys/ioctl.h>

namespace typhon {

namespace {

constexpr std::size_t headerBytes = 128;
/// Of the object that stands for a message.
constexpr std::size_t messageBytes = 1024;

bool hasReadEverything(int socket)
{
    int unread = 0;
    return ::ioctl(socket, SIOCOUTQ, &unread) == 0 && unread == 0;
}

}  // namespace

void OutgoingQueue::sending(const MessageAppending& size, int socket)
{
    if (size.descriptors > 0) {
        unreadDescriptors_ = (hasReadEverything(socket) ? 0 : unreadDescriptors_) + size.descriptors;
    }
}

void OutgoingQueue::sent(const MessageAppending& size, std::uint64_t waiting, const HeldBytes::Peer& peer)
{
    if (waiting > 0) {
        if (!waiting_) {
            waiting_ = std::make_unique<Waiting>(peer);
        }
        waiting_->sizes.push_back(size.bytes + headerBytes);
        waiting_->bytes += waiting_->sizes.back();
    }
    update(waiting, peer);
}

void OutgoingQueue::update(std::uint64_t waiting, const HeldBytes::Peer& peer)
{
    if (waiting == 0) {
        waiting_.reset();
        return;
    }
    if (!waiting_) {
        waiting_ = std::make_unique<Waiting>(peer);
    }
    waiting_->shrinkTo(waiting);
}

void OutgoingQueue::Waiting::shrinkTo(std::uint64_t waiting)
{
    count = waiting;
    while (sizes.size() > waiting) {
        bytes -= sizes.front();
        sizes.pop_front();
    }
    // What sd-bus takes for them in memory, with the room that it leaves for more.
    const auto memory = 2 * bytes + sizes.size() * messageBytes;
    held.shrinkTo(memory);
    tooMuchHeld = memory > held.bytes() && !held.grow(memory - held.bytes());
}

std::string OutgoingQueue::excess(const IpcLimits& limits) const
{
    if (waiting_ && (waiting_->bytes > limits.queuedBytes || waiting_->count > limits.queuedMessages)) {
        return "it left " + std::to_string(waiting_->count) + " messages of about " +
               std::to_string(waiting_->bytes) + " bytes unread";
    }
    if (waiting_ && waiting_->tooMuchHeld) {
        return "with this its process, or its user, left too much unread";
    }
    if (unreadDescriptors_ > limits.unreadDescriptors) {
        return "it left " + std::to_string(unreadDescriptors_) + " descriptors unread";
    }
    return {};
}

}  // namespace typhon
