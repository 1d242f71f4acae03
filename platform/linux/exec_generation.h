#pragma once

#include <cstdint>
#include <optional>

#include <sys/types.h>

namespace typhon {

/// A value that changes with every exec of a process, and means nothing outside of the calling process; 0
/// when it cannot be told. `processIdentifier` is that of the process whose directory in /proc it is:
/// somebody makes sure afterwards that it still is.
std::uint64_t execGeneration(pid_t processIdentifier, int processDirectory);

/// The start time in clock ticks since boot, or null.
std::optional<std::uint64_t> startTime(int processDirectory);

/// A value that differs from boot to boot, never 0.
std::uint32_t bootEpoch();

}  // namespace typhon
