#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace typhon {

/// Text from anywhere, fit for one line of a log or a terminal: control characters become escapes (`\n`,
/// `\t`, `\x1B`, `\u009B`), bytes that are not UTF-8 become U+FFFD, and a result of more than `limit` bytes
/// is cut between characters and ends with how many bytes of the text are missing. Harmless text is
/// returned as it is.
std::string visibleText(std::string_view text, std::size_t limit = std::size_t(-1));

}  // namespace typhon
