#pragma once

#include "platform/file_system.h"
#include "platform/preferences.h"
#include "simulation/simulated_registry.h"

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace typhon::simulation {

/// The daemon's file system, under watch: remembers which fonts the registry held when the daemon read it.
class WatchedFileSystem final : public FileSystem {
public:
    explicit WatchedFileSystem(FileSystem& real) : real_(real) {}
    bool exists(const std::string& path) override { return real_.exists(path); }
    PropertyListReading readPropertyList(const std::string& path) override;
    std::optional<std::vector<std::string>> contentsOfDirectory(const std::string& path) override
    {
        return real_.contentsOfDirectory(path);
    }
    std::unique_ptr<ConfinedDeletion> deletionBelow(const std::string& tree) override
    {
        return real_.deletionBelow(tree);
    }

    /// Whether the registry held that font when the daemon read it for the last time, or for the last but
    /// one: who began to record before a reading is through goes by the one before.
    bool isRegistered(const std::string& path) const
    {
        return lastReading_.contains(path) || readingBefore_.contains(path);
    }

private:
    FileSystem& real_;
    std::set<std::string> lastReading_;
    std::set<std::string> readingBefore_;
};

/// The daemon's preferences, under watch: judges what is recorded in the ledger as it is recorded, and
/// remembers what is to be there after a restart.
class WatchedPreferences final : public Preferences {
public:
    using Report = std::function<void(const std::string& violation)>;

    /// `reportUnregistered` is called for each path in the ledger that is not registered. Everything given
    /// outlives this.
    WatchedPreferences(Preferences& real, const WatchedFileSystem& registry, Report reportUnregistered)
        : real_(real), registry_(registry), reportUnregistered_(std::move(reportUnregistered))
    {}
    std::optional<PropertyList> value(const std::string& key) override { return real_.value(key); }
    void setValue(const std::string& key, std::optional<PropertyList> value) override;
    bool synchronize() override;

    /// A change by somebody else, who has flushed it.
    void noteChangeFromOutside(const std::string& key, const std::optional<PropertyList>& value)
    {
        flushed_.insert_or_assign(key, value);
    }
    /// What has been flushed, by key; null for what was removed.
    const std::map<std::string, std::optional<PropertyList>>& flushed() const { return flushed_; }
    /// Keys that were set and that nobody even tried to flush.
    const std::set<std::string>& neverFlushed() const { return untried_; }

private:
    void judgeIssues(const PropertyList& issues);

    Preferences& real_;
    const WatchedFileSystem& registry_;
    const Report reportUnregistered_;
    std::map<std::string, std::optional<PropertyList>> pending_;
    std::map<std::string, std::optional<PropertyList>> flushed_;
    std::set<std::string> untried_;
};

}  // namespace typhon::simulation
