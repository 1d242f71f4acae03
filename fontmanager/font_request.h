#pragma once

#include "fontmanager/font_names.h"

#include <cstddef>
#include <cstdint>

namespace typhon {

// What goes over the socket between a program and the font-reading process that it started, one packet each.
// Both are of one installation; after an upgrade they may differ for a while, which `version` tells.

constexpr std::uint32_t fontRequestVersion = 1;

/// With it come two descriptors: the font file, and the writing end of a pipe for the answer.
struct FontRequest {
    std::uint32_t version = fontRequestVersion;
    std::uint32_t seconds = 0;
    std::uint64_t memory = 0;
    std::uint64_t fileSize = 0;
    std::uint64_t bytes = 0;
    std::uint64_t faces = 0;
    std::uint64_t nameBytes = 0;
};

/// How a reading ended. The answer counts only after `done`.
enum class FontReadingEnd : std::uint32_t { done, crashed, timedOut, outOfMemory, unconfined, notStarted };

struct FontReadingReport {
    FontReadingEnd end = FontReadingEnd::notStarted;
    /// A signal after `crashed`, an errno after `unconfined` and `notStarted`.
    std::int32_t detail = 0;
};

/// The first packet of the reading process: `version`, or 0 and an errno when it cannot confine itself.
struct FontZygoteGreeting {
    std::uint32_t version = fontRequestVersion;
    std::int32_t error = 0;
};

}  // namespace typhon
