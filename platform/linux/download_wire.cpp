#include "platform/linux/download_wire.h"

#include "platform/linux/descriptor_passing.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/visible_text.h"

#include <array>
#include <cerrno>
#include <span>
#include <utility>

#include <poll.h>
#include <sys/socket.h>

namespace typhon {

namespace {

constexpr std::size_t longestPacket = 16 * 1024;
constexpr std::size_t longestReason = 300;
constexpr PropertyListLimits packetLimits{.bytes = longestPacket, .depth = 2, .values = 32};

struct Packet {
    std::optional<PropertyList> value;
    FileDescriptor file;
};

bool sendPacket(int socket, const PropertyList& value, int file)
{
    const auto bytes = writeBinaryPropertyList(value);
    const std::span files(&file, file >= 0 ? 1 : 0);
    return sendWithDescriptors(socket, bytes, files, MSG_DONTWAIT) == static_cast<ssize_t>(bytes.size());
}

Packet receivePacket(int socket)
{
    std::array<std::uint8_t, longestPacket> buffer;
    iovec data{buffer.data(), buffer.size()};
    alignas(cmsghdr) std::array<char, CMSG_LEN(sizeof(int))> control{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const auto size = ::recvmsg(socket, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    if (size <= 0) {
        return {};
    }
    // There is room for one descriptor; the kernel drops any more.
    auto files = takeDescriptors(message);
    Packet packet{std::nullopt, files.empty() ? FileDescriptor() : std::move(files.front())};
    if ((message.msg_flags & (MSG_TRUNC | MSG_CTRUNC)) == 0) {
        const std::span bytes(buffer.data(), static_cast<std::size_t>(size));
        packet.value = readPropertyList(bytes, packetLimits).value;
    }
    return packet;
}

std::string textMember(const PropertyList& packet, std::string_view name)
{
    const auto* member = packet.find(name);
    return member != nullptr && member->asString() != nullptr ? *member->asString() : std::string();
}

std::int64_t numberMember(const PropertyList& packet, std::string_view name)
{
    const auto* member = packet.find(name);
    return member != nullptr && member->asInteger() != nullptr ? *member->asInteger() : 0;
}

}  // namespace

bool sendDownloadRequest(int socket, const DownloadRequest& request)
{
    const PropertyList packet(
        PropertyList::Dictionary{{"bytesPerSecond", static_cast<std::int64_t>(request.bytesPerSecond)},
                                 {"certificates", request.certificates},
                                 {"mostBytes", static_cast<std::int64_t>(request.mostBytes)},
                                 {"stallSeconds", std::int64_t{request.stallSeconds}},
                                 {"totalSeconds", std::int64_t{request.totalSeconds}},
                                 {"url", request.url}});
    return sendPacket(socket, packet, -1);
}

std::optional<DownloadRequest> receiveDownloadRequest(int socket)
{
    // Whoever made the socket may have made it one that does not block.
    pollfd event{socket, POLLIN, 0};
    while (::poll(&event, 1, -1) < 0 && errno == EINTR) {
    }
    const auto packet = receivePacket(socket);
    if (!packet.value) {
        return std::nullopt;
    }
    DownloadRequest request;
    request.url = textMember(*packet.value, "url");
    request.certificates = textMember(*packet.value, "certificates");
    request.mostBytes = static_cast<std::uint64_t>(numberMember(*packet.value, "mostBytes"));
    request.bytesPerSecond = static_cast<std::uint64_t>(numberMember(*packet.value, "bytesPerSecond"));
    request.stallSeconds = static_cast<std::uint32_t>(numberMember(*packet.value, "stallSeconds"));
    request.totalSeconds = static_cast<std::uint32_t>(numberMember(*packet.value, "totalSeconds"));
    return request;
}

void sendDownloadAnswer(int socket, const std::string& error, int memoryFile)
{
    const bool isThere = memoryFile >= 0 && sealMemoryFile(memoryFile);
    const auto reason = isThere || !error.empty() ? error : "there is no memory for it";
    // Whoever asked may be gone.
    sendPacket(socket, PropertyList::Dictionary{{"error", reason}}, isThere ? memoryFile : -1);
}

DownloadAnswer receiveDownloadAnswer(int socket, std::size_t mostBytes)
{
    const auto packet = receivePacket(socket);
    if (!packet.value) {
        return {{}, "the downloader ended without an answer"};
    }
    if (const auto error = textMember(*packet.value, "error"); !error.empty()) {
        return {{}, visibleText(error, longestReason)};
    }
    auto contents = packet.file ? contentsOfSealedMemoryFile(packet.file.get(), mostBytes) : std::nullopt;
    if (!contents) {
        return {{}, "the downloader gave no answer that can be used"};
    }
    return {*std::move(contents), {}};
}

}  // namespace typhon
