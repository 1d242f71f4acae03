#include "platform/linux/locked_mount.h"

#include "platform/linux/descriptor_passing.h"
#include "platform/linux/inode.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <linux/mount.h>
#include <sched.h>
#include <sys/socket.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

// A mount flag is locked when a mount namespace is copied into another user namespace. So a child process
// makes the mount read-only in a namespace of its own, copies that namespace once more, and clones the locked
// copy. Between fork and exit the child makes system calls only: the daemon has other threads. It never looks
// up a path, because in its user namespaces it lacks the daemon's capabilities.

namespace typhon {

namespace {

/// Prepared before the fork.
struct Identifiers {
    std::string users = std::to_string(::geteuid()) + " " + std::to_string(::geteuid()) + " 1";
    std::string groups = std::to_string(::getegid()) + " " + std::to_string(::getegid()) + " 1";
};

bool writeText(const char* path, std::string_view text)
{
    const int file = ::open(path, O_WRONLY | O_CLOEXEC);
    const bool isWritten = file >= 0 && ::write(file, text.data(), text.size()) == ssize_t(text.size());
    ::close(file);
    return isWritten;
}

int cloneOfWorkingDirectory()
{
    return static_cast<int>(
        ::syscall(SYS_open_tree, AT_FDCWD, ".", OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC | AT_RECURSIVE));
}

/// The whole of the child's work; the descriptor of the mount, or -1.
int makeMount(int directory, const Identifiers& identifiers)
{
    constexpr int namespaces = CLONE_NEWUSER | CLONE_NEWNS;
    if (::fchdir(directory) != 0 || ::unshare(namespaces) != 0 ||
        !writeText("/proc/self/setgroups", "deny") || !writeText("/proc/self/uid_map", identifiers.users) ||
        !writeText("/proc/self/gid_map", identifiers.groups)) {
        return -1;
    }
    const int mount = cloneOfWorkingDirectory();
    mount_attr attributes{};
    attributes.attr_set = MOUNT_ATTR_RDONLY | MOUNT_ATTR_NOSUID | MOUNT_ATTR_NODEV | MOUNT_ATTR_NOEXEC;
    if (mount < 0 ||
        ::syscall(SYS_mount_setattr, mount, "", AT_EMPTY_PATH | AT_RECURSIVE, &attributes,
                  sizeof attributes) != 0 ||
        ::syscall(SYS_move_mount, mount, "", AT_FDCWD, ".", MOVE_MOUNT_F_EMPTY_PATH) != 0 ||
        ::fchdir(mount) != 0 || ::unshare(namespaces) != 0) {
        return -1;
    }
    return cloneOfWorkingDirectory();
}

void send(int socket, int descriptor)
{
    constexpr std::uint8_t byte = 0;
    sendWithDescriptors(socket, std::span(&byte, 1), std::span(&descriptor, 1));
}

FileDescriptor receive(int socket)
{
    char byte = 0;
    iovec data{&byte, 1};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    if (::recvmsg(socket, &message, MSG_CMSG_CLOEXEC) <= 0) {
        return {};
    }
    auto descriptors = takeDescriptors(message);
    return descriptors.empty() ? FileDescriptor() : std::move(descriptors.front());
}

bool isReadOnly(int mount)
{
    struct statvfs fileSystem;
    return ::fstatvfs(mount, &fileSystem) == 0 && (fileSystem.f_flag & ST_RDONLY) != 0;
}

/// The child must not hold the daemon's sockets, should the daemon be killed meanwhile. System calls only.
void closeAllBut(int one, int another)
{
    const auto first = static_cast<unsigned>(std::min(one, another));
    const auto last = static_cast<unsigned>(std::max(one, another));
    constexpr unsigned afterStandardStreams = STDERR_FILENO + 1;
    if (first > afterStandardStreams) {
        ::close_range(afterStandardStreams, first - 1, 0);
    }
    if (last > first + 1) {
        ::close_range(first + 1, last - 1, 0);
    }
    ::close_range(last + 1, ~0U, 0);
}

}  // namespace

FileDescriptor lockedReadOnlyMount(int directory)
{
    int pair[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair) != 0) {
        return {};
    }
    const FileDescriptor ours(pair[0]);
    FileDescriptor theirs(pair[1]);
    const Identifiers identifiers;
    const pid_t child = ::fork();
    if (child == 0) {
        closeAllBut(directory, theirs.get());
        const int mount = makeMount(directory, identifiers);
        if (mount >= 0) {
            send(theirs.get(), mount);
        }
        ::_exit(0);
    }
    theirs = FileDescriptor();
    auto mount = child > 0 ? receive(ours.get()) : FileDescriptor();
    ::waitpid(child, nullptr, 0);
    const bool isRight =
        mount && isReadOnly(mount.get()) && inodeAt(mount.get(), "") == inodeAt(directory, "");
    return isRight ? std::move(mount) : FileDescriptor();
}

}  // namespace typhon
