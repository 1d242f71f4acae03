#include "platform/linux/unicode.h"

#include <algorithm>
#include <cstring>

namespace typhon {
namespace {

constexpr bool isSurrogate(char32_t character)
{
    return character >= 0xD800 && character <= 0xDFFF;
}
constexpr bool isHighSurrogate(char32_t unit)
{
    return unit >= 0xD800 && unit <= 0xDBFF;
}
constexpr bool isLowSurrogate(char32_t unit)
{
    return unit >= 0xDC00 && unit <= 0xDFFF;
}

/// How many bytes follow a leading byte; 0 where it cannot lead several.
std::size_t continuationCount(unsigned char leading)
{
    if (leading >= 0xC2 && leading <= 0xDF)
        return 1;
    if (leading >= 0xE0 && leading <= 0xEF)
        return 2;
    return leading >= 0xF0 && leading <= 0xF4 ? 3 : 0;
}

void appendUnit(std::vector<std::uint8_t>& bytes, char32_t unit)
{
    bytes.push_back(static_cast<std::uint8_t>(unit >> 8));
    bytes.push_back(static_cast<std::uint8_t>(unit & 0xFF));
}

std::size_t asciiPrefix(std::string_view text)
{
    std::size_t length = 0;
    for (std::uint64_t word = 0; length + sizeof word <= text.size(); length += sizeof word) {
        std::memcpy(&word, text.data() + length, sizeof word);
        if ((word & 0x8080808080808080u) != 0)
            break;
    }
    while (length < text.size() && static_cast<unsigned char>(text[length]) < 0x80)
        ++length;
    return length;
}

}  // namespace

Utf8Character firstCharacter(std::string_view text)
{
    const auto leading = static_cast<unsigned char>(text.front());
    if (leading < 0x80)
        return {leading, 1};
    const auto count = continuationCount(leading);
    if (count == 0 || text.size() <= count)
        return {};
    char32_t character = leading & (0x3Fu >> count);
    for (std::size_t index = 1; index <= count; ++index) {
        const auto byte = static_cast<unsigned char>(text[index]);
        if ((byte & 0xC0) != 0x80)
            return {};
        character = character << 6 | (byte & 0x3F);
    }
    constexpr char32_t smallest[] = {0, 0x80, 0x800, 0x10000};
    if (character < smallest[count] || character > 0x10FFFF || isSurrogate(character))
        return {};
    return {character, count + 1};
}

bool isAscii(std::string_view text)
{
    return asciiPrefix(text) == text.size();
}

bool isUtf8(std::string_view text)
{
    text.remove_prefix(asciiPrefix(text));
    while (!text.empty()) {
        const auto character = firstCharacter(text);
        if (!character.value)
            return false;
        text.remove_prefix(character.length);
    }
    return true;
}

void appendUtf8(std::string& text, char32_t character)
{
    const auto continuation = [character](unsigned shift) {
        return static_cast<char>(0x80 | (character >> shift & 0x3F));
    };
    if (character < 0x80) {
        text += static_cast<char>(character);
    } else if (character < 0x800) {
        text += {static_cast<char>(0xC0 | character >> 6), continuation(0)};
    } else if (character < 0x10000) {
        text += {static_cast<char>(0xE0 | character >> 12), continuation(6), continuation(0)};
    } else {
        text +=
            {static_cast<char>(0xF0 | character >> 18), continuation(12), continuation(6), continuation(0)};
    }
}

void appendUtf16BigEndian(std::vector<std::uint8_t>& bytes, std::string_view utf8)
{
    while (!utf8.empty()) {
        const auto [value, length] = firstCharacter(utf8);
        utf8.remove_prefix(length);
        const auto character = value.value_or(replacementCharacter);
        if (character < 0x10000) {
            appendUnit(bytes, character);
            continue;
        }
        appendUnit(bytes, 0xD800 + ((character - 0x10000) >> 10));
        appendUnit(bytes, 0xDC00 + ((character - 0x10000) & 0x3FF));
    }
}

std::optional<std::string> utf8FromUtf16BigEndian(std::span<const std::uint8_t> bytes)
{
    if (bytes.size() % 2 != 0)
        return std::nullopt;
    std::string text;
    text.reserve(bytes.size());
    for (std::size_t at = 0; at < bytes.size(); at += 2) {
        char32_t character = static_cast<char32_t>(bytes[at] << 8 | bytes[at + 1]);
        if (isHighSurrogate(character) && at + 4 <= bytes.size()) {
            const auto low = static_cast<char32_t>(bytes[at + 2] << 8 | bytes[at + 3]);
            if (!isLowSurrogate(low))
                return std::nullopt;
            character = 0x10000 + ((character - 0xD800) << 10) + (low - 0xDC00);
            at += 2;
        }
        if (isSurrogate(character))
            return std::nullopt;
        appendUtf8(text, character);
    }
    return text;
}

}  // namespace typhon
