#pragma once

#include "platform/linux/appstream_metadata.h"
#include "platform/linux/data_directories.h"
#include "platform/linux/desktop_entry.h"
#include "platform/linux/directory_listing.h"
#include "platform/linux/regular_file.h"

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace typhon {

/// The applications that one data directory describes. Names are taken from complete scans, contents from
/// the files as they stand when asked for. Not thread-safe.
class InstalledApplications {
public:
    enum class Contents { entriesAndMetadata, entries };

    /// Without metadata there are no versions.
    explicit InstalledApplications(DataDirectory where, Contents contents = Contents::entriesAndMetadata)
        : where_(std::move(where)), contents_(contents)
    {}

    /// Scans the directory if something was added, removed or renamed since. Null, or what is wrong with it:
    /// too much is left out; and where a scan was not possible, the one before stands.
    std::optional<std::string> refresh();

    /// The desktop entry of the application; null when it is not installed here.
    std::optional<DesktopEntry> entry(const std::string& bundleIdentifier) const;
    /// True when the application is certainly not installed here, or only as a placeholder: the directory was
    /// there, and looked at whole, when it was refreshed.
    bool isKnownToBeAbsent(const std::string& bundleIdentifier) const;
    /// Every application that has an entry here, and those whose entry could not be read just now.
    std::set<std::string> identifiers() const;
    /// The directories of desktop entries that were there, as paths for `DataDirectory::openDirectory`; the
    /// one above all others first. None when there is no such directory.
    std::vector<std::string> entryDirectories() const;
    /// The version that the application's metadata gives.
    std::optional<std::string> version(const std::string& bundleIdentifier);

private:
    struct Metadata {
        FileIdentity identity;
        std::int64_t bytes = 0;
        std::optional<AppStreamMetadata> contents;
    };

    /// What one scan saw.
    struct Scan {
        /// Every directory looked at, by path; null for one that is not there.
        std::map<std::string, std::optional<FileIdentity>> directories;
        bool isSettled = true;
        /// Bundle identifier to desktop entry, and component identifier to metadata; as paths.
        std::map<std::string, std::string> entries;
        std::map<std::string, std::string> metadata;
        /// What was left out.
        std::optional<std::string> complaint;
        /// False when the machine could not do it just now.
        bool isComplete = true;
        /// True when there was too much to look at.
        bool isCut = false;
    };

    bool isCurrent() const;
    FileContents contentsOfEntry(const std::string& path) const;
    DirectoryListing list(const std::string& path, Scan& scan) const;
    void scanEntries(const std::string& path, const std::string& identifierPrefix, int depth,
                     Scan& scan) const;
    void scanMetadata(Scan& scan);
    const Metadata& metadataIn(const std::string& path);

    DataDirectory where_;
    Contents contents_;
    std::optional<Scan> scan_;
    /// True when the latest look saw everything.
    bool sawAll_ = false;
    /// By path. Kept from scan to scan, so that only new files are parsed.
    std::map<std::string, Metadata> metadata_;
};

}  // namespace typhon
