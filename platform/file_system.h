#pragma once

#include "platform/property_list.h"

#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// A parsed property list, or why there is none.
struct PropertyListReading {
    std::optional<PropertyList> value;
    /// Set exactly when `value` is null.
    std::string error;
};

/// Deletes below one directory, the tree, and nothing anywhere else, whatever the paths say: they may come
/// from anybody. No symbolic link is followed below the tree, no mount point is crossed, and no path with
/// ".." or a zero byte is obeyed. Meant for a run of deletions, best in the order of their paths. One thread
/// at a time; blocks on the disk.
class ConfinedDeletion {
public:
    virtual ~ConfinedDeletion() = default;
    /// Deletes what is at `path`: a file, a symbolic link (not where it leads) or a directory with all its
    /// contents. `path` is absolute and begins with the tree's. Null, or why it failed, in words; what of a
    /// directory's contents was deleted before the failure stays deleted.
    virtual std::optional<std::string> removeItem(const std::string& path) = 0;
    /// Deletes the directory at `path`, which may be the tree itself, if nothing is in it. Does nothing
    /// otherwise, whatever the reason.
    virtual void removeEmptyDirectory(const std::string& path) = 0;
};

/// Files by logical path. Any thread; blocks on the disk.
class FileSystem {
public:
    virtual ~FileSystem() = default;
    virtual bool exists(const std::string& path) = 0;
    /// Streams the file through the property-list reader (XML or binary), within the reader's limits. A
    /// directory, a device or a socket is an error.
    virtual PropertyListReading readPropertyList(const std::string& path) = 0;
    /// The names in a directory, sorted, or null when it cannot be listed.
    virtual std::optional<std::vector<std::string>> contentsOfDirectory(const std::string& path) = 0;
    /// For deletions below `tree`, the absolute path of a directory with its final "/". Must not outlive
    /// the file system.
    virtual std::unique_ptr<ConfinedDeletion> deletionBelow(const std::string& tree) = 0;
};

}  // namespace typhon
