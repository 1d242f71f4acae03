#pragma once

#include <cstdint>

namespace typhon {

/// What a downloading process may cost.
struct DownloadLimits {
    std::uint64_t fileBytes = 0;
    std::uint32_t processorSeconds = 0;
    /// Whether everything else goes first.
    bool isPatient = false;
};

/// Before anything is read from anybody: no descriptors but the standard ones, no new privileges, no core
/// files and no tracing. False when that fails.
bool shedInheritance();

/// Once everything is open: another user when this one is root, no capabilities, limits on memory, time, and
/// the size of the result; of the file system what resolving names and checking certificates reads, and no
/// more; no processes, no programs, no sockets but those of the internet. False when that fails, after which
/// the process must not go on. Landlock is done without where the system lacks it.
bool confineDownload(const DownloadLimits& limits);

}  // namespace typhon
