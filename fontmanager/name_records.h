#pragma once

#include <cstddef>
#include <optional>
#include <string>

struct FT_FaceRec_;

namespace typhon {

/// True for 1 to `limit` printable ASCII characters without blanks.
bool isUsablePostScriptName(const std::string& name, std::size_t limit);

/// True for 1 to `limit` bytes of valid UTF-8 without control characters.
bool isUsableFamilyName(const std::string& name, std::size_t limit);

/// The PostScript name of an open face, or null when it has no usable one.
std::optional<std::string> postScriptNameOf(FT_FaceRec_* face, std::size_t limit);

/// The family name of an open face in UTF-8: the typographic family, else the plain one; in English, else in
/// whatever language comes first. Null when there is no usable one.
std::optional<std::string> familyNameOf(FT_FaceRec_* face, std::size_t limit);

}  // namespace typhon
