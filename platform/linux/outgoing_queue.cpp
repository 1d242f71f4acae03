#include "platform/linux/outgoing_queue.h"

#include <linux/sockios.h>
#include <sys/ioctl.h>

namespace typhon {

namespace {

constexpr std::size_t headerBytes = 128;

bool hasReadEverything(int socket)
{
    int unread = 0;
    return ::ioctl(socket, SIOCOUTQ, &unread) == 0 && unread == 0;
}

}  // namespace

void OutgoingQueue::sending(const MessageAppending& size, int socket)
{
    sizes_.push_back(size.bytes + headerBytes);
    bytes_ += sizes_.back();
    if (size.descriptors > 0) {
        unreadDescriptors_ = (hasReadEverything(socket) ? 0 : unreadDescriptors_) + size.descriptors;
    }
}

void OutgoingQueue::update(std::uint64_t waiting)
{
    waiting_ = waiting;
    while (sizes_.size() > waiting) {
        bytes_ -= sizes_.front();
        sizes_.pop_front();
    }
}

std::string OutgoingQueue::excess(const IpcLimits& limits) const
{
    if (bytes_ > limits.queuedBytes || waiting_ > limits.queuedMessages) {
        return "it left " + std::to_string(waiting_) + " messages of about " + std::to_string(bytes_) +
               " bytes unread";
    }
    if (unreadDescriptors_ > limits.unreadDescriptors) {
        return "it left " + std::to_string(unreadDescriptors_) + " descriptors unread";
    }
    return {};
}

}  // namespace typhon
