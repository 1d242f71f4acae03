#include "platform/linux/regular_file.h"

#include <cerrno>
#include <ctime>
#include <system_error>
#include <utility>

#include <linux/openat2.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>

namespace typhon {

namespace {

int openAsPath(int directory, const std::string& path, std::uint64_t resolve)
{
    if (resolve == 0) {
        return ::openat(directory, path.c_str(), O_PATH | O_CLOEXEC);
    }
    open_how how{};
    how.flags = O_PATH | O_CLOEXEC;
    how.resolve = resolve;
    return static_cast<int>(::syscall(SYS_openat2, directory, path.c_str(), &how, sizeof how));
}

/// By the kernel's clock for the times of files, which moves on by a tick now and then.
bool isPast(std::int64_t seconds, std::int64_t nanoseconds)
{
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME_COARSE, &now);
    return std::pair(seconds, nanoseconds) < std::pair(std::int64_t(now.tv_sec), std::int64_t(now.tv_nsec));
}

}  // namespace

FileIdentity::FileIdentity(const struct stat& status)
    : device(status.st_dev), inode(status.st_ino), changeSeconds(status.st_ctim.tv_sec),
      changeNanoseconds(status.st_ctim.tv_nsec), modificationSeconds(status.st_mtim.tv_sec),
      modificationNanoseconds(status.st_mtim.tv_nsec), size(status.st_size)
{}

FileIdentity::FileIdentity(const struct statx& status)
    : device(makedev(status.stx_dev_major, status.stx_dev_minor)), inode(status.stx_ino),
      changeSeconds(status.stx_ctime.tv_sec), changeNanoseconds(status.stx_ctime.tv_nsec),
      modificationSeconds(status.stx_mtime.tv_sec), modificationNanoseconds(status.stx_mtime.tv_nsec),
      size(static_cast<std::int64_t>(status.stx_size))
{}

bool FileIdentity::isSettled() const
{
    return isPast(changeSeconds, changeNanoseconds);
}

bool FileIdentity::hasSettledContents() const
{
    return isPast(modificationSeconds, modificationNanoseconds);
}

bool FileIdentity::hasContentsOf(const FileIdentity& earlier) const
{
    auto same = earlier;
    same.changeSeconds = changeSeconds;
    same.changeNanoseconds = changeNanoseconds;
    return *this == same;
}

OpenedFile openRegularFile(const std::string& path, int directory, std::uint64_t resolve)
{
    OpenedFile opened;
    // First without opening it really: opening a pipe can block and opening a device can have effects.
    const FileDescriptor found(openAsPath(directory, path, resolve));
    if (!found || ::fstat(found.get(), &opened.status) != 0) {
        opened.error = errno;
        return opened;
    }
    if (!S_ISREG(opened.status.st_mode)) {
        opened.error = S_ISDIR(opened.status.st_mode) ? EISDIR : EINVAL;
        return opened;
    }
    const auto same = "/proc/self/fd/" + std::to_string(found.get());
    opened.file = FileDescriptor(::open(same.c_str(), O_RDONLY | O_CLOEXEC));
    if (!opened.file) {
        // Without /proc there seems to be no such file; but there is, and nobody may take it for absent.
        opened.error = errno == ENOENT ? EIO : errno;
    }
    return opened;
}

FileContents readWhole(int descriptor, std::size_t limit)
{
    FileContents contents;
    constexpr std::size_t block = 64 * 1024;
    std::size_t filled = 0;
    while (true) {
        contents.bytes.resize(filled + block);
        const auto count = ::read(descriptor, contents.bytes.data() + filled, block);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            contents.error = errno;
        }
        if (count <= 0) {
            break;
        }
        filled += static_cast<std::size_t>(count);
        if (filled > limit) {
            contents.error = EFBIG;
            break;
        }
    }
    contents.bytes.resize(contents.error == 0 ? filled : 0);
    return contents;
}

std::string OpenedFile::errorText() const
{
    return error == EINVAL ? "not a regular file" : typhon::errorText(error);
}

std::string errorText(int error)
{
    return std::generic_category().message(error);
}

}  // namespace typhon
