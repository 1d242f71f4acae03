#include "simulation/watched_services.h"

#include "platform/font_directories.h"
#include "registry/user_font_registry.h"

namespace typhon::simulation {

namespace {

constexpr const char* issuesKey = "issues";

/// The absolute path that a ledger's entry stands for.
std::string expanded(const std::string& stored)
{
    if (stored.starts_with("U/")) {
        return std::string(font_directories::fontFiles) + stored.substr(2);
    }
    if (stored.starts_with("A/")) {
        return std::string(font_directories::fontAssets) + stored.substr(2);
    }
    return stored;
}

std::set<std::string> registeredIn(const PropertyListReading& reading)
{
    std::set<std::string> paths;
    const auto* root = reading.value ? reading.value->asDictionary() : nullptr;
    for (const auto& [path, entry] : root == nullptr ? PropertyList::Dictionary{} : *root) {
        if (entry.asDictionary() != nullptr) {
            paths.insert(path);
        }
    }
    return paths;
}

}  // namespace

PropertyListReading WatchedFileSystem::readPropertyList(const std::string& path)
{
    auto reading = real_.readPropertyList(path);
    if (path == UserFontRegistry::path) {
        readingBefore_ = std::exchange(lastReading_, registeredIn(reading));
    }
    return reading;
}

void WatchedPreferences::setValue(const std::string& key, std::optional<PropertyList> value)
{
    if (key == issuesKey && value) {
        judgeIssues(*value);
    }
    pending_.insert_or_assign(key, value);
    untried_.insert(key);
    real_.setValue(key, std::move(value));
}

bool WatchedPreferences::synchronize()
{
    untried_.clear();
    if (!real_.synchronize()) {
        return false;
    }
    for (auto& [key, value] : std::exchange(pending_, {})) {
        flushed_.insert_or_assign(key, std::move(value));
    }
    return true;
}

/// A record that is changed is changed as a whole; the others were recorded at their own time.
void WatchedPreferences::judgeIssues(const PropertyList& issues)
{
    const auto before = real_.dictionary(issuesKey);
    for (const auto& [identifier, record] : *issues.asDictionary()) {
        const auto previous = before.find(identifier);
        if (previous != before.end() && previous->second == record) {
            continue;
        }
        for (const auto& stored : stringsOf(record)) {
            if (!registry_.isRegistered(expanded(stored))) {
                reportUnregistered_(stored + " was recorded for " + identifier);
            }
        }
    }
}

}  // namespace typhon::simulation
