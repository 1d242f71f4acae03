#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

namespace typhon {

/// What a font file may cost. Whatever goes beyond is refused with an error.
struct FontLimits {
    std::uint64_t bytes = 512u << 20;
    long faces = 256;
    /// Of one name, in bytes of UTF-8.
    std::size_t nameBytes = 1024;
};

/// The names in a font file, or why there are none.
struct FontNamesReading {
    /// PostScript name to family name, one pair a face, in UTF-8. Never empty.
    std::optional<std::map<std::string, std::string>> familyNames;
    /// Set exactly when `familyNames` is null.
    std::string error;
};

/// Reads the PostScript and family names of every face of a TrueType or OpenType font or collection. The
/// family is the typographic one where the font has one, in English where the font speaks it. The file is
/// read with `pread` and must not be a pipe; the descriptor stays the caller's. Any thread.
FontNamesReading readFontNames(int descriptor, const FontLimits& limits = {});

}  // namespace typhon
