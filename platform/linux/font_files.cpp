#include "platform/linux/font_files.h"

#include "platform/linux/locked_mount.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/regular_file.h"

#include <cerrno>

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

// A descriptor that was opened read-only is not enough: its holder may reopen the file for writing through
// /proc/self/fd if the file's owner is his own user. Through a read-only mount he may not. A directory
// descriptor is never handed out: it can be climbed out of.

namespace typhon {

namespace {

constexpr std::size_t copyLimit = 64u << 20;

/// A regular file below `top`, opened for reading; or none, with errno set.
FileDescriptor openBelow(int top, const std::string& relativePath)
{
    open_how how{};
    // A pipe would block, a terminal would become ours: both are refused below, once they are open.
    how.flags = O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    FileDescriptor file(
        static_cast<int>(::syscall(SYS_openat2, top, relativePath.c_str(), &how, sizeof how)));
    struct stat status;
    if (!file || ::fstat(file.get(), &status) != 0) {
        return {};
    }
    if (!S_ISREG(status.st_mode) || ::fcntl(file.get(), F_SETFL, 0) != 0) {
        errno = EACCES;
        return {};
    }
    return file;
}

FileDescriptor copyOf(int file)
{
    const auto contents = readWhole(file, copyLimit);
    const auto memory = contents.error == 0 ? sealedMemoryFile(contents.bytes) : FileDescriptor();
    return memory ? reopenedReadOnly(memory.get()) : FileDescriptor();
}

}  // namespace

std::shared_ptr<const FontFiles::Mount> FontFiles::mountOf(const FontTree& tree, int directory)
{
    const auto identity = inodeAt(directory, "");
    const std::lock_guard lock(mutex_);
    auto& known = mounts_[tree.path];
    if (!usesMounts_ || !identity || (known && known->tree == *identity)) {
        return usesMounts_ ? known : nullptr;
    }
    known = nullptr;
    if (auto mount = lockedReadOnlyMount(directory)) {
        known = std::make_shared<const Mount>(Mount{*identity, std::move(mount)});
    } else if (!hasComplained_) {
        hasComplained_ = true;
        TYLog_Error(log_, "no private read-only mounts on this system: font files are handed out as copies");
    }
    return known;
}

FontFiles::Opening FontFiles::open(const std::string& path)
{
    const auto* tree = fontTreeOf(path);
    if (tree == nullptr || !isPlainPath(path)) {
        return {{}, Failure::refused};
    }
    const auto treePath = root_.real(tree->path.substr(0, tree->path.size() - 1));
    const FileDescriptor directory(::open(treePath.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    const auto mount = directory ? mountOf(*tree, directory.get()) : nullptr;
    const int top = mount ? mount->descriptor.get() : directory.get();
    auto file = directory ? openBelow(top, path.substr(tree->path.size())) : FileDescriptor();
    if (!file) {
        return {{}, errno == ENOENT || errno == ENOTDIR ? Failure::missing : Failure::refused};
    }
    if (!mount) {
        file = copyOf(file.get());
    }
    const auto failure = file ? Failure::none : Failure::refused;
    return {std::move(file), failure};
}

}  // namespace typhon
