#include "platform/linux/message_decoder.h"

#include "platform/linux/descriptor_passing.h"
#include "platform/linux/message_bytes.h"

#include <cerrno>
#include <optional>
#include <string_view>

#include <sys/socket.h>

namespace typhon {

namespace {

constexpr std::uint8_t descriptorCountField = 9;
/// Codes like this one are to be ignored.
constexpr std::uint8_t unknownField = 200;

/// Walks along the header fields of a message.
class HeaderFields {
public:
    explicit HeaderFields(std::span<const std::uint8_t> bytes) : bytes_(bytes) {}

    /// Where the field is that says how many descriptors the message has; null unless there is exactly one,
    /// and it says `count`.
    std::optional<std::size_t> descriptorCount(std::size_t count);

private:
    bool skipValue(std::uint8_t type);
    std::uint32_t number(std::size_t at) const { return numberIn(bytes_, at); }
    void align(std::size_t to) { at_ = (at_ + to - 1) / to * to; }
    bool has(std::size_t count) const { return at_ <= end_ && count <= end_ - at_; }

    const std::span<const std::uint8_t> bytes_;
    std::size_t at_ = messageHeaderSize;
    std::size_t end_ = 0;
};

bool HeaderFields::skipValue(std::uint8_t type)
{
    const bool isShort = type == 'g';
    if (!isShort) {
        align(4);
    }
    if (!has(isShort ? 1 : 4)) {
        return false;
    }
    const std::size_t length = isShort ? bytes_[at_] : type == 'u' ? 0 : number(at_);
    at_ += (isShort ? 1 : 4);
    const std::size_t rest = type == 'u' ? 0 : length + 1;
    if (!has(rest)) {
        return false;
    }
    at_ += rest;
    return true;
}

std::optional<std::size_t> HeaderFields::descriptorCount(std::size_t count)
{
    std::optional<std::size_t> found;
    if (bytes_.size() < messageHeaderSize || number(12) > bytes_.size() - messageHeaderSize) {
        return std::nullopt;
    }
    end_ = messageHeaderSize + number(12);
    for (align(8); at_ < end_; align(8)) {
        const auto field = at_;
        // A code, and a type of one letter.
        if (!has(4) || bytes_[field + 1] != 1 || bytes_[field + 3] != 0 ||
            std::string_view("sogu").find(static_cast<char>(bytes_[field + 2])) == std::string_view::npos) {
            return std::nullopt;
        }
        at_ += 4;
        const auto value = at_;
        if (!skipValue(bytes_[field + 2])) {
            return std::nullopt;
        }
        if (bytes_[field] == descriptorCountField) {
            if (found || bytes_[field + 2] != 'u' || number(value) != count) {
                return std::nullopt;
            }
            found = field;
        }
    }
    return found;
}

}  // namespace

sd_bus_message* MessageDecoder::decode(ReceivedMessage received)
{
    return isSafe(received) ? feed(received) : nullptr;
}

/// sd-bus forgets, without closing them, the descriptors of a message that it finds invalid. So it gets to
/// see such a message only when it is content with the same one without descriptors.
bool MessageDecoder::isSafe(ReceivedMessage& received)
{
    if (received.descriptors.empty()) {
        return true;
    }
    const auto field = HeaderFields(received.bytes).descriptorCount(received.descriptors.size());
    if (!field) {
        return false;
    }
    ReceivedMessage without{received.bytes, {}};
    without.bytes[*field] = unknownField;
    MessageDecoder trial;
    return trial.feed(without) != nullptr;
}

int MessageDecoder::keep(sd_bus_message* message, void* decoder, sd_bus_error*)
{
    static_cast<MessageDecoder*>(decoder)->message_.reset(sd_bus_message_ref(message));
    return 1;
}

sd_bus_message* MessageDecoder::feed(ReceivedMessage& received)
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
    std::vector<int> passed;
    passed.reserve(descriptors.size());
    for (const auto& descriptor : descriptors) {
        passed.push_back(descriptor.get());
    }
    const auto sent = sendWithDescriptors(bus_.farEnd(), bytes, passed, MSG_DONTWAIT);
    if (sent < 0) {
        return errno == EAGAIN || errno == EINTR;
    }
    bytes = bytes.subspan(static_cast<std::size_t>(sent));
    return true;
}

}  // namespace typhon
