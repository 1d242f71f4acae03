#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

struct stat;

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
/// read with `pread` and must not be a pipe; the descriptor stays the caller's. Any thread. Files that others
/// wrote are for `FontParser`, which does this in a process of its own.
FontNamesReading readFontNames(int descriptor, const FontLimits& limits = {});

/// The same of a file that is known to have `size` bytes, which may have changed meanwhile. The only system
/// calls are `pread` and those of memory.
FontNamesReading readFontNamesOfSize(int descriptor, std::uint64_t size, const FontLimits& limits);

/// Why a file with that status is not read at all, or null.
std::optional<std::string> whyNoFont(const struct stat& status, const FontLimits& limits);

}  // namespace typhon
