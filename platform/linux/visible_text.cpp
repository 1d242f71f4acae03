#include "platform/linux/visible_text.h"

#include <fmt/format.h>

namespace typhon {

namespace {

struct Character {
    char32_t value = 0;
    /// Bytes in the text; 0 when they are no UTF-8.
    std::size_t length = 0;
};

unsigned byteAt(std::string_view text, std::size_t at)
{
    return static_cast<unsigned char>(text[at]);
}

std::size_t lengthFromFirstByte(unsigned first)
{
    if (first < 0x80) {
        return 1;
    }
    if (first < 0xC2 || first > 0xF4) {
        return 0;
    }
    return first < 0xE0 ? 2 : first < 0xF0 ? 3 : 4;
}

/// The first character of a text that is not empty. Surrogates and longer forms than needed are no UTF-8.
Character firstCharacter(std::string_view text)
{
    constexpr char32_t smallest[] = {0, 0, 0x80, 0x800, 0x10000};
    const unsigned first = byteAt(text, 0);
    const std::size_t length = lengthFromFirstByte(first);
    if (length == 0 || length > text.size()) {
        return {};
    }
    char32_t value = length == 1 ? first : first & (0x7Fu >> length);
    for (std::size_t at = 1; at < length; ++at) {
        if ((byteAt(text, at) & 0xC0) != 0x80) {
            return {};
        }
        value = value << 6 | (byteAt(text, at) & 0x3F);
    }
    const bool isSurrogate = value >= 0xD800 && value < 0xE000;
    return value < smallest[length] || isSurrogate || value > 0x10FFFF ? Character{}
                                                                       : Character{value, length};
}

std::string escapeOf(char32_t control)
{
    switch (control) {
    case '\n':
        return "\\n";
    case '\r':
        return "\\r";
    case '\t':
        return "\\t";
    default:
        return control < 0x80 ? fmt::format("\\x{:02X}", static_cast<unsigned>(control))
                              : fmt::format("\\u{:04X}", static_cast<unsigned>(control));
    }
}

}  // namespace

std::string visibleText(std::string_view text, std::size_t limit)
{
    std::string visible;
    while (!text.empty()) {
        const auto [value, length] = firstCharacter(text);
        std::string next(text.substr(0, length));
        if (length == 0) {
            next = "\xEF\xBF\xBD";
        } else if (value < 0x20 || (value >= 0x7F && value < 0xA0)) {
            next = escapeOf(value);
        }
        if (visible.size() + next.size() > limit) {
            return visible + fmt::format("... [{} bytes more]", text.size());
        }
        visible += next;
        text.remove_prefix(length == 0 ? 1 : length);
    }
    return visible;
}

}  // namespace typhon
