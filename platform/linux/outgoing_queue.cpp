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
    // What sd-bus takes for them in memory, with the room that it leaves for more.
    const auto memory = 2 * bytes_ + sizes_.size() * messageBytes;
    held_->shrinkTo(memory);
    tooMuchHeld_ = memory > held_->bytes() && !held_->grow(memory - held_->bytes());
}

void OutgoingQueue::clear()
{
    waiting_ = 0;
    sizes_.clear();
    bytes_ = 0;
    held_->release();
}

std::string OutgoingQueue::excess(const IpcLimits& limits) const
{
    if (bytes_ > limits.queuedBytes || waiting_ > limits.queuedMessages) {
        return "it left " + std::to_string(waiting_) + " messages of about " + std::to_string(bytes_) +
               " bytes unread";
    }
    if (tooMuchHeld_) {
        return "with this its process, or its user, left too much unread";
    }
    if (unreadDescriptors_ > limits.unreadDescriptors) {
        return "it left " + std::to_string(unreadDescriptors_) + " descriptors unread";
    }
    return {};
}

}  // namespace typhon
