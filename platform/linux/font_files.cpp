#include "platform/linux/font_files.h"

#include "platform/linux/locked_mount.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/regular_file.h"

#include <cerrno>
#include <utility>

#include <fcntl.h>
#include <linux/openat2.h>

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
    const FileDescriptor directory(::open(treePath.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!directory) {
        return {{}, failureOf(errno)};
    }
    const auto mount = mountOf(*tree, directory.get());
    const int top = mount ? mount->descriptor.get() : directory.get();
    constexpr auto beneath = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    auto opened = openRegularFile(path.substr(tree->path.size()), top, beneath);
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
