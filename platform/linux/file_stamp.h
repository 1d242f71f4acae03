#pragma once

#include <compare>
#include <cstdint>
#include <optional>
#include <string>

namespace typhon {

/// What changes when a file is replaced, written to or given to somebody else.
struct FileStamp {
    std::uint64_t device = 0;
    std::uint64_t inode = 0;
    std::int64_t changeSeconds = 0;
    std::int64_t changeNanoseconds = 0;
    std::int64_t modificationSeconds = 0;
    std::int64_t modificationNanoseconds = 0;
    std::int64_t size = 0;

    auto operator<=>(const FileStamp&) const = default;

    /// False when the file changed so recently that a further change might leave the same stamp: file
    /// times move in steps of a few milliseconds on some kernels.
    bool isSettled() const;
};

/// Null when there is no such file. Symbolic links are not followed.
std::optional<FileStamp> stampOfPath(const std::string& path);
/// Null unless it is a regular file.
std::optional<FileStamp> stampOfRegularFile(int descriptor);

}  // namespace typhon
