#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {

/// Stands for what is not a character.
inline constexpr char32_t replacementCharacter = 0xFFFD;

/// One character at the front of a text, and how many bytes it takes.
struct Utf8Character {
    /// Null where the bytes are no valid UTF-8 (overlong forms, surrogates and values beyond U+10FFFF
    /// included); `length` is then 1.
    std::optional<char32_t> value;
    std::size_t length = 1;
};

/// `text` must not be empty.
Utf8Character firstCharacter(std::string_view text);

bool isAscii(std::string_view text);
bool isUtf8(std::string_view text);

/// `character` must be a valid scalar value.
void appendUtf8(std::string& text, char32_t character);

/// Invalid bytes become U+FFFD, one each.
void appendUtf16BigEndian(std::vector<std::uint8_t>& bytes, std::string_view utf8);

/// Null for an odd number of bytes or a surrogate without its partner.
std::optional<std::string> utf8FromUtf16BigEndian(std::span<const std::uint8_t> bytes);

}  // namespace typhon
