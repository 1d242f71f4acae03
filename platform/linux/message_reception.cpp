#include "platform/linux/message_reception.h"

#include "platform/linux/descriptor_passing.h"
#include "platform/linux/message_bytes.h"
#include "platform/linux/plain_message.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <iterator>
#include <span>
#include <utility>

#include <sys/socket.h>
#include <sys/stat.h>

namespace typhon {

namespace {

/// What is looked at first; most messages are smaller.
constexpr std::size_t smallLook = 4U << 10;
/// Messages up to this size are read by sd-bus itself.
constexpr std::size_t largeLook = 64U << 10;

using Bytes = std::span<const std::uint8_t>;

bool isWellFormed(Bytes header)
{
    // Every message has fields; with none sd-bus would look for them behind its end.
    return (header[0] == 'l' || header[0] == 'B') && header[3] == 1 && numberIn(header, 12) > 0;
}

/// Fixed header, padded header fields, body.
std::uint64_t messageSize(Bytes header)
{
    const std::uint64_t fields = numberIn(header, 12);
    return messageHeaderSize + (fields + 7) / 8 * 8 + numberIn(header, 4);
}

/// Where messages are looked at. Nothing of it is used later.
std::span<std::uint8_t> scratch()
{
    thread_local std::vector<std::uint8_t> bytes(largeLook + 1);
    return bytes;
}

struct Look {
    ssize_t bytes;
    bool descriptors;
};

/// Without room for descriptors: those stay where they are, and are only noticed.
Look peek(int socket, std::size_t size)
{
    iovec part{scratch().data(), size};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    const auto bytes = ::recvmsg(socket, &message, MSG_PEEK | MSG_DONTWAIT);
    return {bytes, (message.msg_flags & MSG_CTRUNC) != 0};
}

bool isTransient(int error)
{
    return error == EAGAIN || error == EINTR;
}

/// `begun` when sd-bus must not read what there is.
MessageReception::Outcome look(const MessageReception::Source& source)
{
    using Outcome = MessageReception::Outcome;
    auto [waiting, descriptors] = peek(source.socket, smallLook);
    if (waiting <= 0) {
        return waiting < 0 && isTransient(errno) ? Outcome::nothing : Outcome::closed;
    }
    if (static_cast<std::size_t>(waiting) < messageHeaderSize || descriptors) {
        return Outcome::begun;
    }
    const Bytes header = scratch().first(messageHeaderSize);
    const auto size = messageSize(header);
    if (!isWellFormed(header)) {
        return Outcome::malformed;
    }
    if (size > source.maximumBytes) {
        return Outcome::tooLarge;
    }
    if (static_cast<std::size_t>(waiting) < size && size <= largeLook) {
        const auto larger = peek(source.socket, size + 1);
        waiting = larger.bytes;
        descriptors = larger.descriptors;
    }
    const bool isWhole = std::cmp_greater_equal(waiting, size) && !descriptors;
    if (!isWhole || !isPlainMessage(scratch().first(size))) {
        return Outcome::begun;
    }
    return std::cmp_equal(waiting, size) ? Outcome::ready : Outcome::readyAmongOthers;
}

}  // namespace

MessageReception::Outcome MessageReception::next(const Source& source)
{
    if (!unfinished_) {
        const auto outcome = look(source);
        if (outcome != Outcome::begun) {
            return outcome;
        }
        unfinished_ = std::make_unique<Unfinished>(source.peer);
    }
    return assemble(source);
}

MessageReception::Outcome MessageReception::assemble(const Source& source)
{
    for (;;) {
        auto outcome = readMore(source);
        if (outcome != Outcome::ready) {
            return outcome;
        }
        outcome = checkSize(source);
        if (outcome != Outcome::begun) {
            return outcome;
        }
    }
}

/// After more bytes have come.
MessageReception::Outcome MessageReception::checkSize(const Source& source)
{
    const auto& bytes = unfinished_->message.bytes;
    auto& size = unfinished_->size;
    if (size == 0 && bytes.size() >= messageHeaderSize) {
        if (!isWellFormed(bytes)) {
            return Outcome::malformed;
        }
        size = messageSize(bytes);
        if (size > source.maximumBytes) {
            return Outcome::tooLarge;
        }
    }
    return size > 0 && bytes.size() == size ? Outcome::assembled : Outcome::begun;
}

/// Reads once, never beyond the message's end. `ready` when something has come.
MessageReception::Outcome MessageReception::readMore(const Source& source)
{
    auto& bytes = unfinished_->message.bytes;
    const auto size = static_cast<std::size_t>(unfinished_->size);
    const auto missing = (size > 0 ? size : messageHeaderSize) - bytes.size();
    const auto room = scratch().first(std::min(missing, largeLook));
    iovec part{room.data(), room.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(maximumPassedDescriptors * sizeof(int))> control;
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const auto got = ::recvmsg(source.socket, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    if (got <= 0) {
        return got < 0 && isTransient(errno) ? Outcome::begun : Outcome::closed;
    }
    if (!keepDescriptors(message, source.maximumDescriptors)) {
        return Outcome::tooManyDescriptors;
    }
    if (!unfinished_->held.grow(static_cast<std::size_t>(got))) {
        return Outcome::tooMuchHeld;
    }
    bytes.insert(bytes.end(), room.begin(), room.begin() + got);
    return Outcome::ready;
}

bool MessageReception::keepDescriptors(msghdr& message, std::size_t maximum)
{
    auto& descriptors = unfinished_->message.descriptors;
    std::ranges::move(takeDescriptors(message), std::back_inserter(descriptors));
    // Truncated: there was no room for more descriptors in the process.
    return descriptors.size() <= maximum && (message.msg_flags & MSG_CTRUNC) == 0;
}

std::size_t MessageReception::assembledBytes() const
{
    const auto& message = unfinished_->message;
    auto bytes = message.bytes.size();
    for (const auto& descriptor : message.descriptors) {
        struct stat status = {};
        if (::fstat(descriptor.get(), &status) == 0 && S_ISREG(status.st_mode)) {
            bytes += static_cast<std::size_t>(status.st_size);
        }
    }
    return bytes;
}

ReceivedMessage MessageReception::take()
{
    const auto finished = std::move(unfinished_);
    return finished ? std::move(finished->message) : ReceivedMessage();
}

}  // namespace typhon
