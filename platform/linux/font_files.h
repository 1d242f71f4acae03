#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/font_trees.h"
#include "platform/linux/inode.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

namespace typhon {

/// Opens files of the font trees so that whoever gets the descriptor can read that one file and nothing else.
/// Any thread; blocks on the disk.
class FontFiles {
public:
    enum class Failure { none, missing, refused };
    struct Opening {
        FileDescriptor file;
        Failure failure = Failure::none;
    };

    /// `root` and `log` outlive this.
    FontFiles(const RootDirectory& root, Log& log) : root_(root), log_(log) {}

    /// Opens the file at a plain logical path for reading: through a private, locked read-only mount of its
    /// tree, or, where the system has no such mounts, as a sealed copy in memory. Refuses anything but a
    /// regular file, and any symbolic link below the tree.
    Opening open(const std::string& path);

    /// False to hand out copies always.
    void setUsesMounts(bool usesMounts) { usesMounts_ = usesMounts; }

private:
    struct Mount {
        Inode tree;
        FileDescriptor descriptor;
    };
    /// That of the tree at `directory`, if it was made before.
    std::shared_ptr<const Mount> knownMountOf(const FontTree& tree, const std::string& directory);
    std::shared_ptr<const Mount> mountOf(const FontTree& tree, int directory);
    void complainUnless(bool copied);

    const RootDirectory& root_;
    Log& log_;
    std::mutex mutex_;
    std::map<std::string_view, std::shared_ptr<const Mount>> mounts_;
    bool usesMounts_ = true;
    bool hasComplained_ = false;
    bool hasComplainedOfCopies_ = false;
};

}  // namespace typhon
