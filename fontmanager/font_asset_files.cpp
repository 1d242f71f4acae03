#include "fontmanager/font_asset_files.h"

#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <array>
#include <cerrno>

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/sendfile.h>
#include <unistd.h>

// A copy carries the modification time of what it was made of, by which it is known again. Hard links are
// refused across file systems, and by the kernel for files that the caller could not write.

namespace typhon {

namespace {

/// No font file's name begins with a dot.
constexpr const char* temporary = ".installing-asset";
constexpr mode_t filePermissions = 0644;

bool copyBytes(int from, int to, off_t size)
{
    if (::ioctl(to, FICLONE, from) == 0) {
        return true;
    }
    for (off_t at = 0; at < size;) {
        const auto copied = ::sendfile(to, from, &at, static_cast<std::size_t>(size - at));
        if (copied <= 0) {
            errno = copied == 0 ? EIO : errno;
            return false;
        }
    }
    return true;
}

bool copyFile(int from, const struct stat& status, int directory)
{
    const FileDescriptor to(
        ::openat(directory, temporary, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, 0600));
    const std::array times{status.st_atim, status.st_mtim};
    return to && copyBytes(from, to.get(), status.st_size) && ::fchmod(to.get(), filePermissions) == 0 &&
           ::futimens(to.get(), times.data()) == 0 && ::fsync(to.get()) == 0;
}

bool linkFile(int from, int directory)
{
    const auto path = "/proc/self/fd/" + std::to_string(from);
    return ::linkat(AT_FDCWD, path.c_str(), directory, temporary, AT_SYMLINK_FOLLOW) == 0;
}

}  // namespace

std::optional<std::string> placeAssetFile(int from, const struct stat& status, int directory,
                                          const std::string& name)
{
    ::unlinkat(directory, temporary, 0);
    const bool isThere = linkFile(from, directory) || copyFile(from, status, directory);
    const bool isPlaced = isThere && ::renameat(directory, temporary, directory, name.c_str()) == 0;
    const int error = errno;
    // Also after a success: renaming one link of a file to another one leaves both.
    ::unlinkat(directory, temporary, 0);
    return isPlaced ? std::nullopt
                    : std::optional("cannot put " + visibleText(name) + " in its place: " + errorText(error));
}

bool isPlacedAssetFile(const struct stat& status, int directory, const std::string& name)
{
    struct stat there {};
    if (::fstatat(directory, name.c_str(), &there, AT_SYMLINK_NOFOLLOW) != 0 || !S_ISREG(there.st_mode)) {
        return false;
    }
    const bool isLink = there.st_dev == status.st_dev && there.st_ino == status.st_ino;
    return isLink || (there.st_size == status.st_size && there.st_mtim.tv_sec == status.st_mtim.tv_sec &&
                      there.st_mtim.tv_nsec == status.st_mtim.tv_nsec);
}

}  // namespace typhon
