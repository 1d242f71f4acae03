// sd-bus passes over an invalid message in silence and reads on behind it, within the same call, what nobody
// has looked at. So it reads from a peer's socket only what it cannot find invalid. Peers that mean well
// send nothing else; whatever is odd takes the longer way, and is read to its own end at most.

#include "platform/linux/plain_message.h"

#include "platform/linux/message_bytes.h"

#include <algorithm>
#include <array>
#include <string_view>

namespace typhon {

namespace {

enum Type : std::uint8_t { call = 1, answer = 2, error = 3, signal = 4 };
enum Field : std::uint8_t {
    path = 1,
    interface,
    member,
    errorName,
    replySerial,
    destination,
    sender,
    types,
    descriptors
};

constexpr std::size_t longestName = 255;
constexpr unsigned deepestTypes = 16;

constexpr unsigned bit(Field field)
{
    return 1U << field;
}

bool isLetter(char character)
{
    return (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z') ||
           character == '_';
}

bool isDigit(char character)
{
    return character >= '0' && character <= '9';
}

bool isPath(std::string_view text)
{
    if (text == "/") {
        return true;
    }
    bool afterSlash = false;
    for (const char character : text) {
        if (character == '/' ? afterSlash : !isLetter(character) && !isDigit(character)) {
            return false;
        }
        afterSlash = character == '/';
    }
    return text.starts_with('/') && !afterSlash && text != "/org/freedesktop/DBus/Local";
}

/// Elements between dots, of which only those of a unique name may begin with a digit.
bool isDotted(std::string_view text, bool isUnique, bool hyphens)
{
    bool beginning = true;
    for (const char character : text) {
        const bool isDot = character == '.';
        if (isDot ? beginning
                  : !isLetter(character) && !(isDigit(character) && (isUnique || !beginning)) &&
                        !(hyphens && character == '-')) {
            return false;
        }
        beginning = isDot;
    }
    return !beginning && text.find('.') != std::string_view::npos && text.size() < longestName;
}

bool isInterface(std::string_view text)
{
    return isDotted(text, false, false) && text != "org.freedesktop.DBus.Local";
}

bool isDestination(std::string_view text)
{
    const bool isUnique = text.starts_with(':');
    return isDotted(text.substr(isUnique ? 1 : 0), isUnique, true);
}

bool isMember(std::string_view text)
{
    return !text.empty() && text.size() <= longestName && !isDigit(text.front()) &&
           std::ranges::all_of(text,
                               [](char character) { return isLetter(character) || isDigit(character); });
}

bool isBasicType(char type)
{
    return std::string_view("ybnqiuxtdsogh").find(type) != std::string_view::npos;
}

/// Takes one complete type off `rest`; false when there is none.
bool takeType(std::string_view& rest, unsigned depth)
{
    if (rest.empty() || depth > deepestTypes) {
        return false;
    }
    const char first = rest.front();
    rest.remove_prefix(1);
    if (first == 'a' && rest.starts_with('{')) {
        const bool hasKey = rest.size() > 1 && isBasicType(rest[1]);
        rest.remove_prefix(std::min<std::size_t>(rest.size(), 2));
        if (!hasKey || !takeType(rest, depth + 1) || !rest.starts_with('}')) {
            return false;
        }
        rest.remove_prefix(1);
        return true;
    }
    if (first == '(') {
        do {
            if (!takeType(rest, depth + 1)) {
                return false;
            }
        } while (!rest.starts_with(')'));
        rest.remove_prefix(1);
        return true;
    }
    return first == 'a' ? takeType(rest, depth + 1) : first == 'v' || isBasicType(first);
}

bool isSignature(std::string_view text)
{
    while (!text.empty()) {
        if (!takeType(text, 0)) {
            return false;
        }
    }
    return true;
}

/// Walks along the header of one message, of which it believes nothing.
class Header {
public:
    explicit Header(std::span<const std::uint8_t> message) : message_(message) {}

    bool isPlain();

private:
    bool takeField();
    bool takeNumber(Field field);
    bool takeText(Field field);
    bool skipPadding(std::size_t alignment);
    bool has(std::size_t count) const { return count <= end_ - at_; }
    std::uint32_t number(std::size_t at) const { return numberIn(message_, at); }

    const std::span<const std::uint8_t> message_;
    std::size_t at_ = messageHeaderSize;
    std::size_t end_ = 0;
    unsigned found_ = 0;
};

bool Header::skipPadding(std::size_t alignment)
{
    for (; at_ % alignment != 0; ++at_) {
        if (at_ >= message_.size() || message_[at_] != 0) {
            return false;
        }
    }
    return at_ <= end_;
}

bool Header::isPlain()
{
    constexpr std::array<unsigned, 5> needed{0, bit(path) | bit(member), bit(replySerial),
                                             bit(replySerial) | bit(errorName),
                                             bit(path) | bit(interface) | bit(member)};
    if (message_.size() < messageHeaderSize || message_[0] != 'l' || message_[1] < call ||
        message_[1] > signal || message_[3] != 1 || number(8) == 0 ||
        number(12) > message_.size() - messageHeaderSize) {
        return false;
    }
    end_ = messageHeaderSize + number(12);
    while (at_ < end_) {
        if (!skipPadding(8) || !takeField()) {
            return false;
        }
    }
    end_ = message_.size();
    return skipPadding(8) && message_.size() - at_ == number(4) &&
           (found_ & needed[message_[1]]) == needed[message_[1]];
}

/// A code, a type of one letter, and the value.
bool Header::takeField()
{
    if (!has(4) || message_[at_ + 1] != 1 || message_[at_ + 3] != 0) {
        return false;
    }
    const auto field = static_cast<Field>(message_[at_]);
    const char type = static_cast<char>(message_[at_ + 2]);
    if (field < path || field > descriptors || field == sender || (found_ & bit(field)) != 0 ||
        type != "-osssussgu"[field]) {
        return false;
    }
    found_ |= bit(field);
    at_ += 4;
    return field == replySerial || field == descriptors ? takeNumber(field) : takeText(field);
}

/// What some say is that there are no descriptors.
bool Header::takeNumber(Field field)
{
    if (!has(4) || (number(at_) == 0) != (field == descriptors)) {
        return false;
    }
    at_ += 4;
    return true;
}

bool Header::takeText(Field field)
{
    const std::size_t prefix = field == types ? 1 : 4;
    if (!has(prefix)) {
        return false;
    }
    const std::size_t length = field == types ? message_[at_] : number(at_);
    at_ += prefix;
    if (!has(length) || !has(length + 1) || message_[at_ + length] != 0) {
        return false;
    }
    const std::string_view text(reinterpret_cast<const char*>(message_.data()) + at_, length);
    at_ += length + 1;
    switch (field) {
    case path:
        return isPath(text);
    case member:
        return isMember(text);
    case destination:
        return isDestination(text);
    case types:
        return isSignature(text);
    default:
        return isInterface(text);
    }
}

}  // namespace

bool isPlainMessage(std::span<const std::uint8_t> message)
{
    return Header(message).isPlain();
}

}  // namespace typhon
