#pragma once

#include "tools/agent/missing_fonts_choice.h"

#include <cstddef>
#include <string>
#include <vector>

namespace typhon {

struct TerminalSize {
    std::size_t columns = 80;
    std::size_t lines = 24;
};

/// The dialog as lines for a terminal of that size, none wider and no more than fit, with the selected row
/// among them. Without escape sequences, but for one that marks the selected row when `marked`.
std::vector<std::string> dialogPicture(const MissingFontsChoice& choice, const TerminalSize& size,
                                       bool marked = true);

}  // namespace typhon
