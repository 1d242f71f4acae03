#include "platform/linux/visible_text.h"

#include "platform/linux/unicode.h"

#include <algorithm>

#include <fmt/format.h>

namespace typhon {

namespace {

bool isControl(char32_t c)
{
    return c < 0x20 || (c >= 0x7F && c < 0xA0);
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
    if (text.size() <= limit && std::ranges::all_of(text, [](char c) { return c >= 0x20 && c < 0x7F; })) {
        return std::string(text);
    }
    std::string visible;
    while (!text.empty()) {
        const auto [value, length] = firstCharacter(text);
        std::string next;
        if (value && isControl(*value)) {
            next = escapeOf(*value);
        } else {
            appendUtf8(next, value.value_or(replacementCharacter));
        }
        if (visible.size() + next.size() > limit) {
            return visible + fmt::format("... [{} bytes more]", text.size());
        }
        visible += next;
        text.remove_prefix(length);
    }
    return visible;
}

}  // namespace typhon
