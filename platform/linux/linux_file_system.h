#pragma once

#include "platform/file_system.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/slow_reads.h"

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace typhon {

/// The files of this machine. Symbolic links are followed; only regular files are ever opened.
class LinuxFileSystem final : public FileSystem {
public:
    /// Reports readings of property lists that take long to `slowReads`, which outlives it, if given.
    explicit LinuxFileSystem(RootDirectory root, const SlowReads* slowReads = nullptr)
        : root_(std::move(root)), slowReads_(slowReads)
    {}

    bool exists(const std::string& path) override;
    PropertyListReading readPropertyList(const std::string& path) override;
    std::optional<std::vector<std::string>> contentsOfDirectory(const std::string& path) override;
    std::unique_ptr<ConfinedDeletion> deletionBelow(const std::string& tree) override;

private:
    std::optional<std::string> realPath(const std::string& path) const;

    const RootDirectory root_;
    const SlowReads* const slowReads_;
};

}  // namespace typhon
