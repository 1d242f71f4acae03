#pragma once

#include <cstdint>
#include <optional>

namespace typhon {

/// A value that changes with every exec of a process, from its directory in /proc; 0 when it cannot be told.
std::uint64_t execGeneration(int processDirectory);

/// The start time in clock ticks since boot, or null.
std::optional<std::uint64_t> startTime(int processDirectory);

/// A value that differs from boot to boot, never 0.
std::uint32_t bootEpoch();

}  // namespace typhon
