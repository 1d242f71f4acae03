#include "tools/archive_frames.h"

#include <array>
#include <cerrno>
#include <cstring>

#include <unistd.h>

namespace typhon {

namespace {

struct Head {
    std::uint32_t kind = 0;
    std::uint32_t length = 0;
};

bool writeAll(int pipe, const char* bytes, std::size_t length)
{
    while (length > 0) {
        const auto written = ::write(pipe, bytes, length);
        if (written <= 0) {
            return false;
        }
        bytes += written;
        length -= static_cast<std::size_t>(written);
    }
    return true;
}

bool readAll(int pipe, char* bytes, std::size_t length)
{
    while (length > 0) {
        const auto got = ::read(pipe, bytes, length);
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got <= 0) {
            return false;
        }
        bytes += got;
        length -= static_cast<std::size_t>(got);
    }
    return true;
}

}  // namespace

bool writeArchiveFrame(int pipe, ArchiveFrameKind kind, std::string_view bytes)
{
    const Head head{static_cast<std::uint32_t>(kind), static_cast<std::uint32_t>(bytes.size())};
    std::array<char, sizeof head> buffer;
    std::memcpy(buffer.data(), &head, sizeof head);
    return writeAll(pipe, buffer.data(), buffer.size()) && writeAll(pipe, bytes.data(), bytes.size());
}

std::optional<ArchiveFrame> readArchiveFrame(int pipe)
{
    std::array<char, sizeof(Head)> buffer;
    Head head;
    if (!readAll(pipe, buffer.data(), buffer.size())) {
        return std::nullopt;
    }
    std::memcpy(&head, buffer.data(), sizeof head);
    const bool isKnown = head.kind >= static_cast<std::uint32_t>(ArchiveFrameKind::file) &&
                         head.kind <= static_cast<std::uint32_t>(ArchiveFrameKind::end);
    if (!isKnown || head.length > longestArchiveFrame) {
        return std::nullopt;
    }
    ArchiveFrame frame{static_cast<ArchiveFrameKind>(head.kind), std::string(head.length, '\0')};
    return readAll(pipe, frame.bytes.data(), frame.bytes.size()) ? std::optional(std::move(frame))
                                                                 : std::nullopt;
}

}  // namespace typhon
