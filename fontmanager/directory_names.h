#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace typhon {

/// The name of the directory that holds the font files of the application with that identifier. Letters,
/// digits, "-" and "." of ASCII stand for themselves; every other byte is "%" and two upper-case hexadecimal
/// digits, and so are the dots of "." and "..". Different identifiers have different names. Null for the
/// empty identifier, and for one whose name would be longer than a file name may be (255 bytes).
std::optional<std::string> directoryNameFromIdentifier(std::string_view identifier);

/// The identifier whose directory name is exactly this, or null: an escape that was not needed, is
/// incomplete or in lower case makes a name nobody's.
std::optional<std::string> identifierFromDirectoryName(std::string_view directoryName);

}  // namespace typhon
