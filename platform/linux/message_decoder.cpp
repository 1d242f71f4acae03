#include "platform/linux/message_decoder.h"

#include <array>
#include <cerrno>
#include <cstring>

#include <sys/socket.h>

namespace typhon {

int MessageDecoder::keep(sd_bus_message* message, void* decoder, sd_bus_error*)
{
    static_cast<MessageDecoder*>(decoder)->message_.reset(sd_bus_message_ref(message));
    return 1;
}

sd_bus_message* MessageDecoder::decode(ReceivedMessage received)
{
    if (bus_.open(true) < 0 || sd_bus_add_filter(bus_.get(), nullptr, keep, this) < 0) {
        return nullptr;
    }
    std::span<const std::uint8_t> bytes = received.bytes;
    while (!message_) {
        const auto before = bytes.size();
        if (!bytes.empty() && !sendSome(bytes, received.descriptors)) {
            return nullptr;
        }
        const bool sent = bytes.size() < before;
        if (sent) {
            received.descriptors.clear();
        }
        const int result = sd_bus_process(bus_.get(), nullptr);
        // Nothing moves any more: it counts otherwise than we do.
        if (result < 0 || (result == 0 && !sent && !message_)) {
            return nullptr;
        }
    }
    return message_.get();
}

/// Sends as much as the socket takes, the descriptors with the first of it.
bool MessageDecoder::sendSome(std::span<const std::uint8_t>& bytes,
                              const std::vector<FileDescriptor>& descriptors)
{
    iovec part{const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    std::vector<char> control(CMSG_SPACE(descriptors.size() * sizeof(int)));
    if (!descriptors.empty()) {
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        auto* rights = CMSG_FIRSTHDR(&message);
        rights->cmsg_level = SOL_SOCKET;
        rights->cmsg_type = SCM_RIGHTS;
        rights->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
        for (std::size_t index = 0; index < descriptors.size(); ++index) {
            const int descriptor = descriptors[index].get();
            std::memcpy(CMSG_DATA(rights) + index * sizeof(int), &descriptor, sizeof descriptor);
        }
    }
    const auto sent = ::sendmsg(bus_.farEnd(), &message, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (sent < 0) {
        return errno == EAGAIN || errno == EINTR;
    }
    bytes = bytes.subspan(static_cast<std::size_t>(sent));
    return true;
}

}  // namespace typhon
