#pragma once

#include "platform/application_registry.h"
#include "platform/linux/data_directories.h"
#include "platform/linux/installed_applications.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// Installed applications, as desktop entries and AppStream metadata describe them. Reads the disk when
/// asked and never before; between changes an answer costs a few system calls a data directory.
class LinuxApplicationRegistry final : public ApplicationRegistry {
public:
    /// `log` outlives the registry.
    LinuxApplicationRegistry(RootDirectory root, Log& log);

    std::optional<SWApplicationRecord> record(const std::string& bundleIdentifier,
                                              bool allowPlaceholder) override;
    bool isKnownToBeAbsent(const std::string& bundleIdentifier) override;

    /// An application and the data directory whose entry counts.
    struct Known {
        SWApplicationRecord record;
        std::string directory;
    };
    /// All applications, placeholders included, by identifier.
    std::vector<Known> applications();

private:
    std::optional<Known> find(const std::string& bundleIdentifier, bool allowPlaceholder);
    void refresh();
    void refreshDirectories();
    std::optional<std::string> versionOf(const std::string& bundleIdentifier, std::size_t first);

    const RootDirectory root_;
    Log& log_;

    /// Protects all below.
    std::mutex mutex_;
    struct Source {
        DataDirectory where;
        InstalledApplications applications;
        std::optional<std::string> complaint;
    };
    /// Those of the system first.
    std::vector<Source> sources_;
    std::optional<FileIdentity> users_;
    /// True when `sources_` are all there are.
    bool hasAllSources_ = false;
};

}  // namespace typhon
