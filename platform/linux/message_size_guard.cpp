#include "platform/linux/message_size_guard.h"

#include <array>
#include <cstdint>

#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

namespace typhon {

namespace {

constexpr std::size_t headerSize = 16;
using Header = std::array<std::uint8_t, headerSize>;

std::uint32_t number(const Header& header, std::size_t offset)
{
    const bool little = header[0] == 'l';
    std::uint32_t result = 0;
    for (std::size_t index = 0; index < 4; ++index) {
        result |= std::uint32_t{header[offset + index]} << (8 * (little ? index : 3 - index));
    }
    return result;
}

/// Fixed header, padded header fields, body.
std::uint64_t messageSize(const Header& header)
{
    const std::uint64_t fields = number(header, 12);
    return headerSize + (fields + 7) / 8 * 8 + number(header, 4);
}

}  // namespace

bool MessageSizeGuard::admits(int socket)
{
    sawHeader_ = false;
    waiting_ = 0;
    if (position_ == Position::boundary) {
        Header header;
        const auto peeked = ::recv(socket, header.data(), header.size(), MSG_PEEK | MSG_DONTWAIT);
        waiting_ = peeked > 0 ? static_cast<std::size_t>(peeked) : 0;
        sawHeader_ = waiting_ == headerSize;
        return !sawHeader_ || messageSize(header) <= limit_;
    }
    if (position_ == Position::unknown) {
        int waiting = 0;
        waiting_ = ::ioctl(socket, SIOCINQ, &waiting) == 0 ? static_cast<std::size_t>(waiting) : 0;
    }
    return true;
}

bool MessageSizeGuard::hasRead(bool wholeMessage, bool maybeAhead)
{
    if (wholeMessage) {
        position_ = maybeAhead ? Position::unknown : Position::boundary;
        partial_ = 0;
        return true;
    }
    if (waiting_ > 0 && position_ != Position::withinKnown) {
        position_ = sawHeader_ ? Position::withinKnown : Position::unknown;
        partial_ += sawHeader_ ? 0 : waiting_;
    }
    return partial_ <= limit_;
}

}  // namespace typhon
