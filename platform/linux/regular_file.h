#pragma once

#include "platform/linux/file_descriptor.h"

#include <compare>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/stat.h>

namespace typhon {

/// Tells states of a file apart: another file under the same name, or the same one changed in place. Sound
/// for replacements only while the earlier file is held open, because inode numbers are used again.
struct FileIdentity {
    std::uint64_t device = 0;
    std::uint64_t inode = 0;
    std::int64_t changeSeconds = 0;
    std::int64_t changeNanoseconds = 0;
    std::int64_t modificationSeconds = 0;
    std::int64_t modificationNanoseconds = 0;
    std::int64_t size = 0;

    FileIdentity() = default;
    explicit FileIdentity(const struct stat& status);
    explicit FileIdentity(const struct statx& status);
    // NOLINTNEXTLINE(modernize-use-nullptr): it misreads the comparison
    auto operator<=>(const FileIdentity&) const = default;

    /// True when every change from now on will show: the file's last change is earlier than the kernel's
    /// clock for such times, which may stand still for some milliseconds. Asked before a reading, it says
    /// whether that reading may be kept for as long as the identity stays.
    bool isSettled() const;
    /// The same of changes to its contents alone: for a file that is about to be renamed.
    bool hasSettledContents() const;
    /// True for the same file with the same contents, if those were settled at the time of this one. It may
    /// have been renamed or given other permissions since.
    bool hasContentsOf(const FileIdentity& earlier) const;
};

/// An open regular file, or why there is none.
struct OpenedFile {
    FileDescriptor file;
    struct stat status = {};
    /// An errno; 0 when the file is open. EINVAL for what is neither a regular file nor a directory.
    int error = 0;

    /// The error in words.
    std::string errorText() const;
};

/// Opens a regular file for reading, following symbolic links. Nothing else is ever opened, so that no pipe
/// blocks and no device notices. `path` is relative to `directory` (a descriptor, or AT_FDCWD);
/// `resolve` restricts the way there as for openat2.
OpenedFile openRegularFile(const std::string& path, int directory = AT_FDCWD, std::uint64_t resolve = 0);

/// What is left in an open file, or why it cannot be had.
struct FileContents {
    std::vector<std::uint8_t> bytes;
    /// An errno; 0 when `bytes` is everything. EFBIG when there is more than the limit.
    int error = 0;
};
FileContents readWhole(int descriptor, std::size_t limit);

/// The text of an errno.
std::string errorText(int error);

}  // namespace typhon
