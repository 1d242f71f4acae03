#include "platform/linux/descriptor_passing.h"

#include <array>
#include <cerrno>
#include <cstring>

namespace typhon {

ssize_t sendWithDescriptors(int socket, std::span<const std::uint8_t> bytes, std::span<const int> descriptors,
                            int flags)
{
    if (descriptors.size() > maximumPassedDescriptors) {
        errno = EINVAL;
        return -1;
    }
    iovec part{const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(maximumPassedDescriptors * sizeof(int))> control;
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (!descriptors.empty()) {
        message.msg_control = control.data();
        message.msg_controllen = CMSG_SPACE(descriptors.size_bytes());
        auto* rights = CMSG_FIRSTHDR(&message);
        rights->cmsg_level = SOL_SOCKET;
        rights->cmsg_type = SCM_RIGHTS;
        rights->cmsg_len = CMSG_LEN(descriptors.size_bytes());
        std::memcpy(CMSG_DATA(rights), descriptors.data(), descriptors.size_bytes());
    }
    return ::sendmsg(socket, &message, flags | MSG_NOSIGNAL);
}

std::vector<FileDescriptor> takeDescriptors(msghdr& message)
{
    std::vector<FileDescriptor> taken;
    for (auto* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
        if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) {
            continue;
        }
        const auto count = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
        for (std::size_t index = 0; index < count; ++index) {
            int descriptor = -1;
            std::memcpy(&descriptor, CMSG_DATA(part) + index * sizeof(int), sizeof descriptor);
            taken.emplace_back(descriptor);
        }
    }
    return taken;
}

}  // namespace typhon
