#pragma once

#include "platform/linux/process_inspection.h"

#include <cstdint>
#include <optional>
#include <vector>

#include <sys/types.h>

namespace typhon {

/// What decides about access to files: the file-system user and group, the supplementary groups, and the
/// capabilities that override permissions.
struct FileCredentials {
    uid_t user = 0;
    gid_t group = 0;
    std::vector<gid_t> groups;
    /// Of the effective capabilities, those that override file permissions (as a bit mask).
    std::uint64_t overrides = 0;

    bool operator==(const FileCredentials&) const = default;
};

/// The capabilities that let a process read what its user may not.
inline constexpr std::uint64_t readOverrides = (1u << 1) | (1u << 2);

/// The credentials of a process; null when they cannot be read. Capabilities that it holds in a user
/// namespace of its own are not counted.
std::optional<FileCredentials> fileCredentialsOf(const ProcessInspection& process, bool hasOwnUserNamespace);

/// Those of the calling thread.
FileCredentials ownFileCredentials();

/// Gives them to the calling thread alone. False when that is not allowed; the thread's credentials are then
/// unspecified.
bool assumeFileCredentials(const FileCredentials& credentials);

}  // namespace typhon
