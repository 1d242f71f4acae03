#include "platform/linux/base64.h"

#include <algorithm>
#include <array>

namespace typhon {
namespace {

constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint8_t refused = 0xFF;
constexpr std::uint8_t space = 0xFE;
constexpr std::uint8_t padding = 0xFD;

/// By character: its six bits, or one of the marks above.
constexpr auto meanings = [] {
    std::array<std::uint8_t, 256> table{};
    table.fill(refused);
    for (std::size_t value = 0; value < alphabet.size(); ++value)
        table[static_cast<unsigned char>(alphabet[value])] = static_cast<std::uint8_t>(value);
    for (const char blank : {' ', '\t', '\n', '\r'})
        table[static_cast<unsigned char>(blank)] = space;
    table['='] = padding;
    return table;
}();

std::uint8_t byteOf(unsigned group, unsigned shift)
{
    return static_cast<std::uint8_t>(group >> shift & 0xFF);
}

}  // namespace

bool Base64Decoder::take(unsigned sextet, std::vector<std::uint8_t>& bytes)
{
    if (padding_ != 0)
        return false;
    group_ = group_ << 6 | sextet;
    if (++count_ == 4) {
        bytes.insert(bytes.end(), {byteOf(group_, 16), byteOf(group_, 8), byteOf(group_, 0)});
        group_ = count_ = 0;
    }
    return true;
}

bool Base64Decoder::pad(std::vector<std::uint8_t>& bytes)
{
    if (count_ + padding_ < 2 || count_ + padding_ == 4)
        return false;
    if (count_ + ++padding_ < 4)
        return true;
    // Bits that no byte uses must be zero: otherwise one value would have several texts.
    if (count_ == 2) {
        bytes.push_back(byteOf(group_, 4));
        return (group_ & 0xF) == 0;
    }
    bytes.insert(bytes.end(), {byteOf(group_, 10), byteOf(group_, 2)});
    return (group_ & 0x3) == 0;
}

bool Base64Decoder::decode(std::string_view text, std::vector<std::uint8_t>& bytes)
{
    for (const char character : text) {
        const auto meaning = meanings[static_cast<unsigned char>(character)];
        if (meaning < 64 ? !take(meaning, bytes) : meaning == padding ? !pad(bytes) : meaning == refused)
            return false;
    }
    return true;
}

bool Base64Decoder::finish()
{
    const bool complete = count_ == 0 || count_ + padding_ == 4;
    *this = {};
    return complete;
}

std::optional<std::vector<std::uint8_t>> bytesFromBase64(std::string_view text)
{
    std::vector<std::uint8_t> bytes;
    bytes.reserve(text.size() / 4 * 3);
    Base64Decoder decoder;
    if (!decoder.decode(text, bytes) || !decoder.finish())
        return std::nullopt;
    return bytes;
}

void appendBase64(std::string& text, std::span<const std::uint8_t> bytes)
{
    while (!bytes.empty()) {
        unsigned group = static_cast<unsigned>(bytes[0]) << 16;
        if (bytes.size() > 1)
            group |= static_cast<unsigned>(bytes[1]) << 8;
        if (bytes.size() > 2)
            group |= bytes[2];
        text += alphabet[group >> 18];
        text += alphabet[group >> 12 & 0x3F];
        text += bytes.size() > 1 ? alphabet[group >> 6 & 0x3F] : '=';
        text += bytes.size() > 2 ? alphabet[group & 0x3F] : '=';
        bytes = bytes.subspan(std::min<std::size_t>(bytes.size(), 3));
    }
}

std::string base64FromBytes(std::span<const std::uint8_t> bytes)
{
    std::string text;
    text.reserve((bytes.size() + 2) / 3 * 4);
    appendBase64(text, bytes);
    return text;
}

}  // namespace typhon
