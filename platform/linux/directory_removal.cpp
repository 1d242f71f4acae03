#include "platform/linux/directory_removal.h"

#include "platform/linux/regular_file.h"

#include <cerrno>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>

// A directory is emptied through its own descriptor and never by path, so that nothing that is put in the way
// meanwhile can lead elsewhere. Every name is first deleted as if it were no directory: the kernel says when
// it is one, and a symbolic link goes by itself. The directories on the way are kept in a list and not on the
// stack: how deep they are is up to whoever made them.

namespace typhon {

namespace {

constexpr std::size_t deepest = 100;

struct DirectoryCloser {
    void operator()(DIR* directory) const { ::closedir(directory); }
};

/// A directory that is being emptied, and its name in the one above.
struct Level {
    std::unique_ptr<DIR, DirectoryCloser> stream;
    std::string name;

    int descriptor() const { return ::dirfd(stream.get()); }
};

std::optional<std::string> enter(int parent, const std::string& name, std::vector<Level>& levels)
{
    if (levels.size() == deepest) {
        return "directories nested more than " + std::to_string(deepest) + " deep";
    }
    auto directory = openDirectoryBeneath(parent, name, O_RDONLY);
    std::unique_ptr<DIR, DirectoryCloser> stream(directory ? ::fdopendir(directory.get()) : nullptr);
    if (!stream) {
        return errorText(errno);
    }
    directory.release();
    levels.push_back({std::move(stream), name});
    return std::nullopt;
}

/// The next name in the directory; empty at its end.
std::optional<std::string> readName(const Level& level, std::string& name)
{
    name.clear();
    errno = 0;
    while (const auto* entry = ::readdir(level.stream.get())) {
        const std::string_view found = entry->d_name;
        if (found != "." && found != "..") {
            name = found;
            return std::nullopt;
        }
    }
    return errno == 0 ? std::nullopt : std::optional(errorText(errno));
}

std::optional<std::string> removeEmptied(int parent, const std::string& name)
{
    return ::unlinkat(parent, name.c_str(), AT_REMOVEDIR) == 0 ? std::nullopt
                                                               : std::optional(errorText(errno));
}

/// Deletes an entry that is no directory, or enters the one that is.
std::optional<std::string> removeOrEnter(int parent, const std::string& name, std::vector<Level>& levels)
{
    if (::unlinkat(parent, name.c_str(), 0) == 0) {
        return std::nullopt;
    }
    return errno == EISDIR ? enter(parent, name, levels) : errorText(errno);
}

}  // namespace

FileDescriptor openDirectoryBeneath(int top, const std::string& path, int flags)
{
    open_how how{};
    how.flags = static_cast<unsigned>(flags) | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS | RESOLVE_NO_XDEV;
    return FileDescriptor(static_cast<int>(::syscall(SYS_openat2, top, path.c_str(), &how, sizeof how)));
}

std::optional<std::string> removeEntry(int parent, const std::string& name)
{
    std::vector<Level> levels;
    auto error = removeOrEnter(parent, name, levels);
    std::string next;
    while (!error && !levels.empty()) {
        error = readName(levels.back(), next);
        if (error) {
            break;
        }
        if (!next.empty()) {
            error = removeOrEnter(levels.back().descriptor(), next, levels);
            continue;
        }
        const auto emptied = std::move(levels.back());
        levels.pop_back();
        error = removeEmptied(levels.empty() ? parent : levels.back().descriptor(), emptied.name);
    }
    return error;
}

}  // namespace typhon
