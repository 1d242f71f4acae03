#include "platform/linux/linux_confined_deletion.h"

#include "platform/linux/directory_removal.h"
#include "platform/linux/regular_file.h"
#include "platform/path_below.h"

#include <cerrno>
#include <utility>

#include <fcntl.h>
#include <unistd.h>

// The way to the tree is the administrator's and may hold symbolic links. From the tree's descriptor on, the
// kernel is told to leave it by no means. The descriptor of the last parent is kept for the next path:
// opening it anew for each of thousands of files would cost as much as deleting them.

namespace typhon {

namespace {

std::string joined(const std::vector<std::string>& names)
{
    std::string path;
    for (const auto& name : names) {
        path += (path.empty() ? "" : "/") + name;
    }
    return path;
}

}  // namespace

LinuxConfinedDeletion::LinuxConfinedDeletion(const RootDirectory& root, std::string tree)
    : tree_(std::move(tree)), realTree_(root.real(tree_)),
      top_(::open(realTree_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC)), topError_(top_ ? 0 : errno)
{}

std::optional<std::string> LinuxConfinedDeletion::removeItem(const std::string& path)
{
    const auto names = namesBelow(tree_, path);
    if (!names) {
        return "not a plain path below " + tree_;
    }
    if (names->empty()) {
        return "this is the directory itself";
    }
    const int parent = directoryHolding(*names);
    return parent < 0 ? errorText(errno) : removeEntry(parent, names->back());
}

void LinuxConfinedDeletion::removeEmptyDirectory(const std::string& path)
{
    if (path + "/" == tree_) {
        ::rmdir(realTree_.substr(0, realTree_.size() - 1).c_str());
        return;
    }
    const auto names = namesBelow(tree_, path);
    if (!names || names->empty()) {
        return;
    }
    if (const int parent = directoryHolding(*names); parent >= 0) {
        ::unlinkat(parent, names->back().c_str(), AT_REMOVEDIR);
    }
}

int LinuxConfinedDeletion::directoryHolding(const std::vector<std::string>& names)
{
    if (!top_) {
        errno = topError_;
        return -1;
    }
    auto path = joined({names.begin(), names.end() - 1});
    if (path.empty()) {
        return top_.get();
    }
    if (!last_ || path != lastPath_) {
        last_ = openDirectoryBeneath(top_.get(), path, O_PATH);
        lastPath_ = std::move(path);
    }
    return last_.get();
}

}  // namespace typhon
