#pragma once

#include <compare>
#include <cstdint>
#include <optional>

#include <fcntl.h>
#include <sys/stat.h>

namespace typhon {

/// Which file it is: its device and inode. Namespaces are told apart by theirs. Good for as long as somebody
/// holds the file open.
struct Inode {
    std::uint64_t device = 0;
    std::uint64_t number = 0;
    // NOLINTNEXTLINE(modernize-use-nullptr): it misreads the comparison
    auto operator<=>(const Inode&) const = default;
};

/// The inode at a path, or of `directory` itself when the path is empty; null when there is none.
inline std::optional<Inode> inodeAt(int directory, const char* path)
{
    struct stat status;
    if (::fstatat(directory, path, &status, *path == '\0' ? AT_EMPTY_PATH : 0) != 0) {
        return std::nullopt;
    }
    return Inode{status.st_dev, status.st_ino};
}

}  // namespace typhon
