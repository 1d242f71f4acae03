#pragma once

#include "platform/linux/file_descriptor.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include <sys/types.h>

namespace typhon {

/// An exclusive lock among processes, and among the threads of one, taken on a file of its own beside what
/// it protects. The kernel lets go of it when its holder ends in whatever way. The lock file stays.
class FileLock {
public:
    /// Creates the lock file if need be and waits, at most that long, for the present holder.
    explicit FileLock(const std::string& path, std::chrono::milliseconds patience = std::chrono::seconds(5));

    /// Null when the lock is held; else why not.
    const std::optional<std::string>& error() const { return error_; }

private:
    FileDescriptor file_;
    std::optional<std::string> error_;
};

/// The functions below return null, or why they failed.

/// Creates a directory and those above it, with these permissions whatever the umask, flushed to
/// disk.
std::optional<std::string> makeDirectories(const std::string& path, mode_t permissions);

/// Makes `path` a file with these contents and permissions in one step that a crash or power cut cannot
/// split: written beside it as `path` + ".new", flushed, renamed, and the directory flushed. Callers exclude
/// each other with a lock; what a crashed one left behind is replaced. When root writes into a directory of
/// another user, the file becomes that user's. Its modification time is one that no later change of the
/// contents can have.
std::optional<std::string> replaceFile(const std::string& path, std::span<const std::uint8_t> contents,
                                       mode_t permissions);

/// The two halves of `replaceFile`, for a caller that has something to do in between: the first needs room on
/// the disk, the second only a rename.
std::optional<std::string> prepareReplacement(const std::string& path, std::span<const std::uint8_t> contents,
                                              mode_t permissions);
std::optional<std::string> finishReplacement(const std::string& path);
/// The path of the file in between the two.
std::string replacementOf(const std::string& path);

/// Flushes names that were added to, changed in or removed from a directory.
std::optional<std::string> flushDirectory(const std::string& path);

/// When root has made `path` in a directory of another user, makes it that user's. False when that failed.
bool giveToOwnerOfDirectory(const std::string& path);

/// The directory that holds `path`, which is absolute.
std::string directoryOf(const std::string& path);

}  // namespace typhon
