#include "platform/linux/pidfd.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <string>
#include <string_view>

#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/vfs.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr long pidFileSystem = 0x50494446;

/// The first published layout of the kernel's `struct pidfd_info`, which the system's headers lack.
struct PidfdInfo {
    std::uint64_t mask;
    std::uint64_t cgroup;
    std::uint32_t pid;
    std::uint32_t threadGroup;
    std::uint32_t parent;
    std::uint32_t realUser;
    std::uint32_t realGroup;
    std::uint32_t effectiveUser;
    std::uint32_t effectiveGroup;
    std::uint32_t savedUser;
    std::uint32_t savedGroup;
    std::uint32_t fileSystemUser;
    std::uint32_t fileSystemGroup;
    std::int32_t exitCode;
};
static_assert(sizeof(PidfdInfo) == 64);
constexpr unsigned long getInfo = _IOWR(0xFF, 11, PidfdInfo);
constexpr std::uint64_t infoPid = 1;
constexpr std::uint64_t infoCredentials = 2;

/// The answer of kernels before 6.13: the "Pid:" line of the descriptor's own entry in /proc.
std::optional<PidfdProcess> processFromProc(int pidfd)
{
    const auto path = "/proc/self/fdinfo/" + std::to_string(pidfd);
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    std::array<char, 1024> buffer;
    const auto length = ::read(file.get(), buffer.data(), buffer.size());
    const std::string_view text(buffer.data(), length > 0 ? static_cast<std::size_t>(length) : 0);
    const auto line = text.find("\nPid:\t");
    if (line == std::string_view::npos) {
        return std::nullopt;
    }
    pid_t pid = 0;
    std::from_chars(text.data() + line + 6, text.data() + text.size(), pid);
    struct stat status;
    if (pid <= 0 || ::stat(("/proc/" + std::to_string(pid)).c_str(), &status) != 0) {
        return std::nullopt;
    }
    return PidfdProcess{pid, status.st_uid, status.st_uid};
}

}  // namespace

FileDescriptor openPidfd(pid_t processIdentifier)
{
    return FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, processIdentifier, 0)));
}

bool isPidfd(int descriptor)
{
    constexpr std::string_view expected = "anon_inode:[pidfd]";
    std::array<char, 64> target;
    const auto link = "/proc/self/fd/" + std::to_string(descriptor);
    const auto length = ::readlink(link.c_str(), target.data(), target.size());
    return length > 0 && std::string_view(target.data(), static_cast<std::size_t>(length)) == expected;
}

std::optional<PidfdProcess> processOfPidfd(int pidfd)
{
    PidfdInfo info;
    std::memset(&info, 0, sizeof info);
    info.mask = infoPid | infoCredentials;
    if (::ioctl(pidfd, getInfo, &info) != 0) {
        return errno == ENOTTY || errno == EINVAL ? processFromProc(pidfd) : std::nullopt;
    }
    if ((info.mask & infoPid) == 0 || (info.mask & infoCredentials) == 0 || info.pid == 0 ||
        info.pid != info.threadGroup) {
        return std::nullopt;
    }
    return PidfdProcess{static_cast<pid_t>(info.pid), info.effectiveUser, info.realUser};
}

bool hasExited(int pidfd)
{
    pollfd descriptor{.fd = pidfd, .events = POLLIN, .revents = 0};
    return ::poll(&descriptor, 1, 0) != 0;
}

std::optional<std::uint64_t> inodeOfPidfd(int pidfd)
{
    struct statfs fileSystem;
    struct stat status;
    if (::fstatfs(pidfd, &fileSystem) != 0 || fileSystem.f_type != pidFileSystem ||
        ::fstat(pidfd, &status) != 0) {
        return std::nullopt;
    }
    return status.st_ino;
}

bool kernelHasProcessInodes()
{
    static const bool has = [] {
        const auto own = openPidfd(::getpid());
        // By its path, so that a test can play a kernel without them and leave other files alone.
        struct statfs fileSystem;
        return ::statfs(("/proc/self/fd/" + std::to_string(own.get())).c_str(), &fileSystem) == 0 &&
               fileSystem.f_type == pidFileSystem;
    }();
    return has;
}

}  // namespace typhon
