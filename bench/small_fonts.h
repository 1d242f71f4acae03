#pragma once

#include <string>

namespace typhon::bench {

/// A whole font file of about a kilobyte, which FreeType and fontconfig take like any other: it covers ASCII,
/// with empty outlines, and is named after the font file of that number in the sample registry.
std::string smallFont(int index);

}  // namespace typhon::bench
