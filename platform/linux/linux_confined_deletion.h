#pragma once

#include "platform/file_system.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// Deletions below one directory of this machine, relative to its descriptor.
class LinuxConfinedDeletion final : public ConfinedDeletion {
public:
    LinuxConfinedDeletion(const RootDirectory& root, std::string tree);

    std::optional<std::string> removeItem(const std::string& path) override;
    void removeEmptyDirectory(const std::string& path) override;

private:
    /// The descriptor of the directory that those names but the last lead to, or -1 with errno set.
    int directoryHolding(const std::vector<std::string>& names);

    /// Logical, with its final "/".
    const std::string tree_;
    const std::string realTree_;
    const FileDescriptor top_;
    const int topError_;
    /// The directory of the deletion before, which is often that of the next.
    std::string lastPath_;
    FileDescriptor last_;
};

}  // namespace typhon
