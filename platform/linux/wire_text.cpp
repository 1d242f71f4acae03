#include "platform/linux/wire_text.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>

namespace typhon {

namespace {

/// The character at the front of `text`: its length in bytes, or 0 when it cannot be carried.
std::size_t carriedLength(std::string_view text)
{
    const auto byte = [&](std::size_t index) { return static_cast<std::uint8_t>(text[index]); };
    const auto first = byte(0);
    if (first < 0x80) {
        return first == 0 ? 0 : 1;
    }
    const std::size_t length = first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
    if (first < 0xC2 || first > 0xF4 || text.size() < length) {
        return 0;
    }
    std::uint32_t character = first & (0xFFU >> (length + 1));
    for (std::size_t index = 1; index < length; ++index) {
        if ((byte(index) & 0xC0) != 0x80) {
            return 0;
        }
        character = (character << 6) | (byte(index) & 0x3FU);
    }
    constexpr std::uint32_t smallest[] = {0, 0, 0x80, 0x800, 0x10000};
    const bool surrogate = character >= 0xD800 && character <= 0xDFFF;
    const bool noncharacter = (character >= 0xFDD0 && character <= 0xFDEF) || (character & 0xFFFE) == 0xFFFE;
    const bool valid = character >= smallest[length] && character <= 0x10FFFF && !surrogate && !noncharacter;
    return valid ? length : 0;
}

}  // namespace

bool isWireText(std::string_view text)
{
    while (!text.empty()) {
        const auto length = carriedLength(text);
        if (length == 0) {
            return false;
        }
        text.remove_prefix(length);
    }
    return true;
}

std::string wireText(std::string_view text)
{
    std::string result;
    while (!text.empty()) {
        const auto length = carriedLength(text);
        result += length == 0 ? std::string_view("\xEF\xBF\xBD") : text.substr(0, length);
        text.remove_prefix(std::max<std::size_t>(length, 1));
    }
    return result;
}

}  // namespace typhon
