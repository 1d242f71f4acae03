#include "platform/linux/font_files.h"

#include "platform/linux/locked_mount.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/regular_file.h"

#include <cerrno>
#include <utility>

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

FileDescriptor copyOf(int file)
{
    const auto contents = readWhole(file, copyLimit);
    const auto memory = contents.error == 0 ? sealedMemoryFile(contents.bytes) : FileDescriptor();
    return memory ? reopenedReadOnly(memory.get()) : FileDescriptor();
}

FontFiles::Failure failureOf(int error)
{
    return error == ENOENT || error == ENOTDIR ? FontFiles::Failure::missing : FontFiles::Failure::refused;
}

/// Through a mount without devices, opening can neither block nor have effects.
OpenedFile openRegularFileOfMount(const std::string& path, int mount, std::uint64_t resolve)
{
    open_how how{};
    how.flags = O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
    how.resolve = resolve;
    OpenedFile opened;
    FileDescriptor file(static_cast<int>(::syscall(SYS_openat2, mount, path.c_str(), &how, sizeof how)));
    if (!file || ::fstat(file.get(), &opened.status) != 0 || ::fcntl(file.get(), F_SETFL, 0) != 0) {
        opened.error = errno;
    } else if (!S_ISREG(opened.status.st_mode)) {
        opened.error = EINVAL;
    } else {
        opened.file = std::move(file);
    }
    return opened;
}

}  // namespace

std::shared_ptr<const FontFiles::Mount> FontFiles::knownMountOf(const FontTree& tree,
                                                                const std::string& directory)
{
    const auto identity = inodeAt(AT_FDCWD, directory.c_str());
    const std::lock_guard lock(mutex_);
    const auto known = mounts_.find(tree.path);
    const bool isCurrent = usesMounts_ && identity && known != mounts_.end() && known->second &&
                           known->second->tree == *identity;
    return isCurrent ? known->second : nullptr;
}

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
        TYLog_Error(
            log_, "no private read-only mounts on this system: font files are handed out as copies in memory"
                  " (allow user namespaces: user.max_user_namespaces above 0)");
    }
    return known;
}

void FontFiles::complainUnless(bool copied)
{
    const std::lock_guard lock(mutex_);
    if (!copied && !std::exchange(hasComplainedOfCopies_, true)) {
        TYLog_Error(
            log_,
            "font files cannot be handed out: there are neither read-only mounts (allow user namespaces) nor "
            "memory for copies of them (allow memfd_create; a font file has at most 64 MiB then)");
    }
}

FontFiles::Opening FontFiles::open(const std::string& path)
{
    const auto* tree = fontTreeOf(path);
    if (tree == nullptr || !isPlainPath(path)) {
        return {{}, Failure::refused};
    }
    const auto treePath = root_.real(tree->path.substr(0, tree->path.size() - 1));
    auto mount = knownMountOf(*tree, treePath);
    FileDescriptor directory;
    if (!mount) {
        directory = FileDescriptor(::open(treePath.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
        if (!directory) {
            return {{}, failureOf(errno)};
        }
        mount = mountOf(*tree, directory.get());
    }
    constexpr auto beneath = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    const auto name = path.substr(tree->path.size());
    auto opened = mount ? openRegularFileOfMount(name, mount->descriptor.get(), beneath)
                        : openRegularFile(name, directory.get(), beneath);
    if (opened.error != 0) {
        return {{}, failureOf(opened.error)};
    }
    auto file = std::move(opened.file);
    if (!mount) {
        file = copyOf(file.get());
        complainUnless(static_cast<bool>(file));
    }
    const auto failure = file ? Failure::none : Failure::refused;
    return {std::move(file), failure};
}

}  // namespace typhon
