#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace typhon {

/// How many columns of a terminal a text takes that `displayText` made.
std::size_t displayWidth(std::string_view text);

/// Text from anywhere as one harmless piece of a line: control characters and those that change the order or
/// the place of others become escapes, piled-up accents are dropped, and what is wider than `width` columns
/// is cut and ends with "...".
std::string displayText(std::string_view text, std::size_t width);

/// The same, filled up with blanks to exactly `width` columns.
std::string displayField(std::string_view text, std::size_t width);

}  // namespace typhon
