#pragma once

#include "platform/linux/file_descriptor.h"

#include <cstdint>
#include <optional>

#include <sys/types.h>

namespace typhon {

/// What the kernel says about the process behind a pidfd.
struct PidfdProcess {
    pid_t processIdentifier = 0;
    uid_t effectiveUser = 0;
    uid_t realUser = 0;
};

/// A pidfd of a process, or none.
FileDescriptor openPidfd(pid_t processIdentifier);

/// True for a pidfd. Safe to ask of any descriptor that somebody passed: nothing is done with it.
bool isPidfd(int descriptor);

/// The process behind a pidfd, or null when it has been reaped, is out of sight or the descriptor is no
/// pidfd.
std::optional<PidfdProcess> processOfPidfd(int pidfd);

/// True once the process behind a pidfd has ended.
bool hasExited(int pidfd);

/// True when pidfds have inodes of their own (Linux 6.9), which no two processes of a boot share. Before
/// that a process instance is told by its start time alone, which a reused process identifier may repeat.
bool kernelHasProcessInodes();

/// The inode of a pidfd, or null when it is not on the pid file system.
std::optional<std::uint64_t> inodeOfPidfd(int pidfd);

}  // namespace typhon
