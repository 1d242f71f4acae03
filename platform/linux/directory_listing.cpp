#include "platform/linux/directory_listing.h"

#include <algorithm>
#include <cerrno>
#include <memory>
#include <string_view>

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

namespace typhon {

namespace {

struct DirectoryCloser {
    void operator()(DIR* directory) const { ::closedir(directory); }
};
using OpenDirectory = std::unique_ptr<DIR, DirectoryCloser>;

/// With an offset of its own, so that the descriptor can be listed again.
OpenDirectory reopened(int directory)
{
    const int another = ::openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    DIR* const stream = another < 0 ? nullptr : ::fdopendir(another);
    if (another >= 0 && stream == nullptr) {
        ::close(another);
    }
    return OpenDirectory(stream);
}

bool isDirectory(int directory, const dirent& entry)
{
    if (entry.d_type != DT_UNKNOWN) {
        return entry.d_type == DT_DIR;
    }
    struct stat status {};
    return ::fstatat(directory, entry.d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(status.st_mode);
}

void readNames(DIR* stream, int directory, std::size_t limit, DirectoryListing& listing)
{
    errno = 0;
    while (const auto* entry = ::readdir(stream)) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") {
            if (listing.files.size() + listing.directories.size() == limit) {
                listing.isCut = true;
                return;
            }
            (isDirectory(directory, *entry) ? listing.directories : listing.files).emplace_back(name);
        }
        errno = 0;
    }
    listing.error = errno;
}

}  // namespace

DirectoryListing listDirectory(int directory, std::size_t limit)
{
    DirectoryListing listing;
    struct stat status {};
    const auto stream = reopened(directory);
    if (!stream || ::fstat(directory, &status) != 0) {
        listing.error = errno;
        return listing;
    }
    listing.identity = FileIdentity(status);
    listing.isSettled = listing.identity.isSettled();
    readNames(stream.get(), directory, limit, listing);
    std::ranges::sort(listing.files);
    std::ranges::sort(listing.directories);
    return listing;
}

}  // namespace typhon
