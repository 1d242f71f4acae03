#pragma once

#include "fontmanager/font_names.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace typhon {

/// A reading as the bytes that a reading process answers with.
std::vector<std::uint8_t> encodeFontAnswer(const FontNamesReading& reading);

/// The reading in an answer, which may be any bytes at all: what a font within `limits` cannot have given is
/// an error.
FontNamesReading decodeFontAnswer(std::span<const std::uint8_t> answer, const FontLimits& limits);

/// The size of the largest answer that can be accepted.
std::size_t largestFontAnswer(const FontLimits& limits);

}  // namespace typhon
