#pragma once

#include "fontmanager/font_names.h"

#include <cstdint>
#include <functional>

namespace typhon {

/// What a reader does with a font file of `size` bytes. The product's is `readFontNamesOfSize`.
using FontReadingFunction =
    std::function<FontNamesReading(int descriptor, std::uint64_t size, const FontLimits& limits)>;

/// The whole of a program that reads fonts for the one that started it, with a SOCK_SEQPACKET socket to it as
/// standard input: confines itself, then makes a confined process for each file. Returns the exit status when
/// the other end is closed. The process must have one thread.
int runFontZygote(const FontReadingFunction& readFont);

}  // namespace typhon
