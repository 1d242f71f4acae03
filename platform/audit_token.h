#pragma once

#include <cstdint>

namespace typhon {

/// The identity of one run of one program in one process, as seen when it connected. Passed by value; all
/// zero when there is no current connection. Every decision about a caller is keyed by it, and every
/// service that takes one first checks that the process still is that process in that program.
struct AuditToken {
    std::uint32_t version = 0;
    std::int32_t processIdentifier = 0;
    /// Inode of the process's pidfs file: unique among all processes since boot.
    std::uint64_t processInstance = 0;
    /// Changes with every exec.
    std::uint64_t execGeneration = 0;
    std::uint32_t effectiveUser = 0;
    /// Tells boots apart.
    std::uint32_t bootEpoch = 0;

    bool operator==(const AuditToken&) const = default;
};
static_assert(sizeof(AuditToken) == 32);

}  // namespace typhon
