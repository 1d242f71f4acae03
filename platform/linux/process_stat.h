#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include <sys/types.h>

namespace typhon {

/// Where a process stands among groups, sessions and terminals. Numbers are those of the namespace whose
/// /proc was read; 0 for what lies outside of it or does not exist.
struct ProcessStat {
    pid_t parent = 0;
    pid_t group = 0;
    pid_t session = 0;
    /// The device number of the controlling terminal, as the kernel encodes it.
    std::uint32_t terminal = 0;
    /// The foreground process group of the controlling terminal.
    pid_t foregroundGroup = 0;
};

/// Reads /proc/PID/stat; null for anything else.
std::optional<ProcessStat> processStatFrom(std::string_view text);

}  // namespace typhon
