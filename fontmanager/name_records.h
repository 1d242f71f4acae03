#pragma once

#include <cstddef>
#include <optional>
#include <string>

struct FT_FaceRec_;

namespace typhon {

/// The PostScript name of an open face, or null when it has none of 1 to `limit` printable ASCII characters
/// without blanks.
std::optional<std::string> postScriptNameOf(FT_FaceRec_* face, std::size_t limit);

/// The family name of an open face in UTF-8: the typographic family, else the plain one; in English, else in
/// whatever language comes first. Null when there is none of 1 to `limit` bytes that is valid text without
/// control characters.
std::optional<std::string> familyNameOf(FT_FaceRec_* face, std::size_t limit);

}  // namespace typhon
