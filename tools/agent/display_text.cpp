#include "tools/agent/display_text.h"

#include "platform/linux/unicode.h"
#include "platform/linux/visible_text.h"

#include <algorithm>
#include <array>

#include <fmt/format.h>

namespace typhon {

namespace {

struct Range {
    char32_t first;
    char32_t last;
};

/// Invisible characters that move others about or hide what is there.
constexpr std::array hidden{Range{0x00AD, 0x00AD}, Range{0x061C, 0x061C},   Range{0x115F, 0x1160},
                            Range{0x180B, 0x180F}, Range{0x200B, 0x200F},   Range{0x2028, 0x202E},
                            Range{0x2060, 0x206F}, Range{0x3164, 0x3164},   Range{0xFEFF, 0xFEFF},
                            Range{0xFFF0, 0xFFFB}, Range{0xE0000, 0xE0FFF}, Range{0xE000, 0xF8FF}};
constexpr std::array combining{Range{0x0300, 0x036F}, Range{0x0483, 0x0489}, Range{0x0591, 0x05BD},
                               Range{0x064B, 0x065F}, Range{0x0E31, 0x0E31}, Range{0x0E34, 0x0E3A},
                               Range{0x1AB0, 0x1AFF}, Range{0x1DC0, 0x1DFF}, Range{0x20D0, 0x20FF},
                               Range{0x302A, 0x302F}, Range{0x3099, 0x309A}, Range{0xFE00, 0xFE0F},
                               Range{0xFE20, 0xFE2F}};
constexpr std::array wide{Range{0x1100, 0x115F},   Range{0x2E80, 0x303E},   Range{0x3041, 0xA4CF},
                          Range{0xA960, 0xA97F},   Range{0xAC00, 0xD7A3},   Range{0xF900, 0xFAFF},
                          Range{0xFE30, 0xFE6F},   Range{0xFF00, 0xFF60},   Range{0xFFE0, 0xFFE6},
                          Range{0x1F300, 0x1F64F}, Range{0x1F680, 0x1F6FF}, Range{0x1F900, 0x1FAFF},
                          Range{0x20000, 0x3FFFD}};
constexpr std::size_t mostAccents = 2;

template <std::size_t size>
bool isIn(const std::array<Range, size>& ranges, char32_t character)
{
    return std::ranges::any_of(
        ranges, [&](const Range& range) { return character >= range.first && character <= range.last; });
}

std::size_t widthOf(char32_t character)
{
    return isIn(combining, character) ? 0 : isIn(wide, character) ? 2 : 1;
}

/// Calls `take` with each character and its bytes until it returns false.
template <class Take>
void forEach(std::string_view text, Take take)
{
    while (!text.empty()) {
        const auto character = firstCharacter(text);
        if (!take(character.value.value_or(replacementCharacter), text.substr(0, character.length))) {
            return;
        }
        text.remove_prefix(character.length);
    }
}

/// Without anything that is not what it looks like.
std::string harmless(std::string_view text)
{
    std::string result;
    std::size_t accents = mostAccents;
    forEach(text, [&](char32_t character, std::string_view bytes) {
        if (isIn(hidden, character)) {
            result += fmt::format("\\u{:04X}", static_cast<std::uint32_t>(character));
            accents = 0;
        } else if (widthOf(character) > 0) {
            result += bytes;
            accents = 0;
        } else if (accents++ < mostAccents) {
            result += bytes;
        }
        return true;
    });
    return result;
}

std::string cut(const std::string& text, std::size_t width)
{
    std::string result;
    std::size_t taken = 0;
    forEach(text, [&](char32_t character, std::string_view bytes) {
        taken += widthOf(character);
        if (taken <= width) {
            result += bytes;
        }
        return taken <= width;
    });
    return result;
}

}  // namespace

std::size_t displayWidth(std::string_view text)
{
    std::size_t width = 0;
    forEach(text, [&](char32_t character, std::string_view) {
        width += widthOf(character);
        return true;
    });
    return width;
}

std::string displayText(std::string_view text, std::size_t width)
{
    // A name may be a megabyte long; what can be seen of it is not.
    const std::size_t enough = width * 16 + 64;
    auto whole = harmless(visibleText(text.substr(0, enough)));
    if (displayWidth(whole) <= width && text.size() <= enough) {
        return whole;
    }
    return width < 3 ? cut(whole, width) : cut(whole, width - 3) + "...";
}

std::string displayField(std::string_view text, std::size_t width)
{
    auto field = displayText(text, width);
    field.append(width - std::min(width, displayWidth(field)), ' ');
    return field;
}

}  // namespace typhon
