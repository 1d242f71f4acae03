#include "platform/linux/directory_listing.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <string_view>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {

namespace {

bool isDirectory(int directory, const dirent64& entry)
{
    if (entry.d_type != DT_UNKNOWN) {
        return entry.d_type == DT_DIR;
    }
    struct stat status {};
    return ::fstatat(directory, entry.d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(status.st_mode);
}

/// False when there is no room for it.
bool add(int directory, const dirent64& entry, std::size_t limit, DirectoryListing& listing)
{
    const std::string_view name = entry.d_name;
    if (name == "." || name == "..") {
        return true;
    }
    if (listing.files.size() + listing.directories.size() == limit) {
        listing.isCut = true;
        return false;
    }
    (isDirectory(directory, entry) ? listing.directories : listing.files).emplace_back(name);
    return true;
}

void readNames(int directory, std::size_t limit, DirectoryListing& listing)
{
    constexpr std::size_t blockSize = 32U << 10;
    alignas(dirent64) std::array<char, blockSize> block;
    auto length = ::lseek(directory, 0, SEEK_SET) < 0 ? -1 : ::getdents64(directory, block.data(), blockSize);
    for (; length > 0; length = ::getdents64(directory, block.data(), blockSize)) {
        for (ssize_t at = 0; at < length;) {
            const auto& entry = *reinterpret_cast<const dirent64*>(block.data() + at);
            if (!add(directory, entry, limit, listing)) {
                return;
            }
            at += entry.d_reclen;
        }
    }
    listing.error = length < 0 ? errno : 0;
}

}  // namespace

DirectoryListing listDirectory(int directory, std::size_t limit)
{
    DirectoryListing listing;
    struct stat status {};
    if (::fstat(directory, &status) != 0) {
        listing.error = errno;
        return listing;
    }
    listing.identity = FileIdentity(status);
    listing.isSettled = listing.identity.isSettled();
    readNames(directory, limit, listing);
    std::ranges::sort(listing.files);
    std::ranges::sort(listing.directories);
    return listing;
}

}  // namespace typhon
