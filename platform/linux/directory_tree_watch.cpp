#include "platform/linux/directory_tree_watch.h"

#include "platform/linux/directory_listing.h"
#include "platform/linux/visible_text.h"

#include <cerrno>

#include <fcntl.h>

// A directory is watched first and listed afterwards; what is created in it between the two is seen twice and
// nothing is missed. Directories that are held open on the way down are as many as the tree is deep.

namespace typhon {

namespace {

constexpr std::size_t mostNames = 1U << 20;
constexpr unsigned deepest = 64;
constexpr int directoryFlags = O_RDONLY | O_DIRECTORY | O_CLOEXEC;

}  // namespace

bool DirectoryTreeWatch::covers(const std::string& realPath) const
{
    const auto top = root_.real(path_);
    return realPath.starts_with(top) && (realPath.size() == top.size() || realPath[top.size()] == '/');
}

void DirectoryTreeWatch::watchAll(DirectoryWatch& watch, std::set<std::string>& seen,
                                  std::set<std::string>& appeared)
{
    watchWay(watch, seen);
    const auto top = root_.real(path_);
    const FileDescriptor directory(::open(top.c_str(), directoryFlags));
    if (directory) {
        watchBelow(watch, directory.get(), top, 0, seen, appeared);
    }
}

/// Every directory above, for the one name that leads on.
void DirectoryTreeWatch::watchWay(DirectoryWatch& watch, std::set<std::string>& seen)
{
    for (std::size_t at = 0; at != std::string::npos; at = path_.find('/', at + 1)) {
        const auto above = root_.real(path_.substr(0, at));
        const FileDescriptor directory(::open((above + "/").c_str(), directoryFlags));
        if (!directory) {
            return;
        }
        const auto next = path_.substr(at + 1, path_.find('/', at + 1) - at - 1);
        bool isNew = false;
        if (put(watch, directory.get(), above, next, isNew)) {
            seen.insert(above);
        }
    }
}

void DirectoryTreeWatch::watchBelow(DirectoryWatch& watch, int directory, const std::string& path,
                                    unsigned depth, std::set<std::string>& seen,
                                    std::set<std::string>& appeared)
{
    bool isNew = false;
    if (depth > deepest || !put(watch, directory, path, {}, isNew)) {
        return;
    }
    seen.insert(path);
    const auto listing = listDirectory(directory, mostNames);
    if (isNew) {
        appeared.insert(path);
        for (const auto& name : listing.files) {
            appeared.insert(path + "/" + name);
        }
    }
    for (const auto& name : listing.directories) {
        const FileDescriptor below(::openat(directory, name.c_str(), directoryFlags | O_NOFOLLOW));
        if (below) {
            watchBelow(watch, below.get(), path + "/" + name, depth + 1, seen, appeared);
        }
    }
}

bool DirectoryTreeWatch::put(DirectoryWatch& watch, int directory, const std::string& path,
                             const std::string& onlyName, bool& isNew)
{
    const auto outcome = watch.watch(path, directory, onlyName);
    isNew = outcome == DirectoryWatch::Outcome::added;
    if (outcome != DirectoryWatch::Outcome::failed) {
        return true;
    }
    if (!std::exchange(hasComplained_, true)) {
        const int error = errno;
        TYLog_Error(log_, "cannot watch " + visibleText(path) + ": " + errorText(error) +
                              "; changes there may go unnoticed until the next start");
    }
    return false;
}

}  // namespace typhon
