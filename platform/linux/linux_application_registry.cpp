#include "platform/linux/linux_application_registry.h"

#include <algorithm>
#include <utility>

// What the administrator installed comes before what a user installed under the same identifier. A user can
// install anything for itself, and give it any version: what that is worth is for the threat model.

namespace typhon {

LinuxApplicationRegistry::LinuxApplicationRegistry(RootDirectory root, Log& log)
    : root_(std::move(root)), log_(log)
{}

std::optional<SWApplicationRecord> LinuxApplicationRegistry::record(const std::string& bundleIdentifier,
                                                                    bool allowPlaceholder)
{
    const std::lock_guard lock(mutex_);
    refresh();
    auto known = find(bundleIdentifier, allowPlaceholder);
    return known ? std::optional(std::move(known->record)) : std::nullopt;
}

bool LinuxApplicationRegistry::isKnownToBeAbsent(const std::string& bundleIdentifier)
{
    const std::lock_guard lock(mutex_);
    refresh();
    return hasAllSources_ && std::ranges::all_of(sources_, [&](const Source& source) {
               return source.applications.isKnownToBeAbsent(bundleIdentifier);
           });
}

std::vector<LinuxApplicationRegistry::Known> LinuxApplicationRegistry::applications()
{
    const std::lock_guard lock(mutex_);
    refresh();
    std::set<std::string> identifiers;
    for (const auto& source : sources_) {
        identifiers.merge(source.applications.identifiers());
    }
    std::vector<Known> applications;
    for (const auto& identifier : identifiers) {
        // A real one counts before a placeholder, in whatever directory.
        auto known = find(identifier, false);
        known = known ? std::move(known) : find(identifier, true);
        if (known) {
            applications.push_back(std::move(*known));
        }
    }
    return applications;
}

std::optional<LinuxApplicationRegistry::Known>
LinuxApplicationRegistry::find(const std::string& bundleIdentifier, bool allowPlaceholder)
{
    for (std::size_t index = 0; index < sources_.size(); ++index) {
        const auto entry = sources_[index].applications.entry(bundleIdentifier);
        if (entry && (allowPlaceholder || !entry->isPlaceholder)) {
            return Known{.record = {.bundleIdentifier = bundleIdentifier,
                                    .shortVersionString = versionOf(bundleIdentifier, index),
                                    .isPlaceholder = entry->isPlaceholder},
                         .directory = sources_[index].where.path()};
        }
    }
    return std::nullopt;
}

/// From the entry's own data directory, else from the first that knows one.
std::optional<std::string> LinuxApplicationRegistry::versionOf(const std::string& bundleIdentifier,
                                                               std::size_t first)
{
    if (auto version = sources_[first].applications.version(bundleIdentifier)) {
        return version;
    }
    for (auto& source : sources_) {
        if (auto version = source.applications.version(bundleIdentifier)) {
            return version;
        }
    }
    return std::nullopt;
}

void LinuxApplicationRegistry::refresh()
{
    refreshDirectories();
    for (auto& source : sources_) {
        const auto complaint = source.applications.refresh();
        if (complaint && complaint != source.complaint) {
            TYLog_Error(log_, "installed applications in " + source.where.path() + ": " + *complaint);
        }
        source.complaint = complaint;
    }
}

/// Sources that stay keep what they have scanned.
void LinuxApplicationRegistry::refreshDirectories()
{
    const auto users = identityOfUserDatabase(root_);
    if (hasAllSources_ && users && users == users_) {
        return;
    }
    std::vector<Source> sources;
    auto directories = dataDirectories(root_);
    for (auto& where : directories.found) {
        const auto known = std::ranges::find(sources_, where.path(),
                                             [](const Source& source) { return source.where.path(); });
        if (known != sources_.end()) {
            sources.push_back(std::move(*known));
        } else {
            sources.push_back(
                {.where = where, .applications = InstalledApplications(where), .complaint = {}});
        }
    }
    sources_ = std::move(sources);
    users_ = users;
    hasAllSources_ = directories.isComplete;
}

}  // namespace typhon
