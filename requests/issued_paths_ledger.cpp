#include "requests/issued_paths_ledger.h"

#include "platform/font_directories.h"
#include "platform/ipc.h"

#include <algorithm>
#include <array>
#include <set>
#include <string_view>

namespace typhon {

namespace {

constexpr const char* issuesKey = "issues";
constexpr const char* resetEntitlement = "com.vorlan.Typhon.allow-reset-issued-fonts";

struct Abbreviation {
    std::string_view stored;
    std::string_view directory;
};

constexpr std::array abbreviations{
    Abbreviation{"U/", font_directories::fontFiles},
    Abbreviation{"A/", font_directories::fontAssets},
};

std::string replacePrefix(const std::string& text, std::string_view prefix, std::string_view replacement)
{
    return std::string(replacement) + text.substr(prefix.size());
}

std::string shortened(const std::string& path)
{
    for (const auto& [stored, directory] : abbreviations) {
        if (path.starts_with(directory)) {
            return replacePrefix(path, directory, stored);
        }
    }
    return path;
}

std::string expanded(const std::string& storedPath)
{
    for (const auto& [stored, directory] : abbreviations) {
        if (storedPath.starts_with(stored)) {
            return replacePrefix(storedPath, stored, directory);
        }
    }
    return storedPath;
}

std::vector<std::string> expandedAll(const PropertyList& storedPaths)
{
    auto paths = stringsOf(storedPaths);
    std::ranges::transform(paths, paths.begin(), expanded);
    return paths;
}

/// The record of an application, or null when there is none, or none that is an array.
const PropertyList* recordOf(const PropertyList::Dictionary& issues, const std::string& identifier)
{
    const auto found = issues.find(identifier);
    return found == issues.end() || found->second.asArray() == nullptr ? nullptr : &found->second;
}

std::vector<std::string> sanitized(const RegistrySnapshot* registry, const std::vector<std::string>& paths)
{
    std::set<std::string> stored;
    for (const auto& path : paths) {
        if (registry != nullptr && registry->entry(path) != nullptr) {
            stored.insert(shortened(path));
        }
    }
    return {stored.begin(), stored.end()};
}

bool areEqualAsSets(const std::vector<std::string>& sortedPaths, const PropertyList& record)
{
    const auto stored = stringsOf(record);
    return std::ranges::equal(sortedPaths, std::set<std::string>(stored.begin(), stored.end()));
}

}  // namespace

std::vector<std::string> IssuedPathsLedger::sanitizeIssuedFontPaths(const std::vector<std::string>& paths)
{
    return sanitized(registry_.userFontsInfo().get(), paths);
}

void IssuedPathsLedger::recordIssuedFontPaths(std::vector<std::string> paths,
                                              const std::optional<std::string>& forIdentifier)
{
    if (!forIdentifier) {
        return;
    }
    // Taken before the lock: it may have to wait for the registry to be read.
    const auto registry = registry_.userFontsInfo();
    const std::lock_guard lock(writing_);
    auto issues = preferences_.dictionary(issuesKey);
    const auto* previous = recordOf(issues, *forIdentifier);
    if (previous != nullptr) {
        std::ranges::move(expandedAll(*previous), std::back_inserter(paths));
    }
    const auto issued = sanitized(registry.get(), paths);
    if (previous != nullptr && areEqualAsSets(issued, *previous)) {
        return;
    }
    issues.insert_or_assign(*forIdentifier, arrayOfStrings(issued));
    store(std::move(issues));
}

std::vector<std::string> IssuedPathsLedger::issuedFontFilePathsForIdentifier(const std::string& identifier)
{
    const auto issues = preferences_.dictionary(issuesKey);
    const auto* record = recordOf(issues, identifier);
    return record == nullptr ? std::vector<std::string>{} : expandedAll(*record);
}

void IssuedPathsLedger::forgetClientApplication(const std::optional<std::string>& identifier)
{
    if (!identifier) {
        return;
    }
    const std::lock_guard lock(writing_);
    auto issues = preferences_.dictionary(issuesKey);
    if (issues.erase(*identifier) != 0) {
        store(std::move(issues));
    }
}

Task<void> IssuedPathsLedger::resetIssuedFontsFor(std::string identifier, EmptyReply reply)
{
    if (isCallerEntitledToReset()) {
        forgetClientApplication(identifier);
    }
    reply();
    co_return;
}

bool IssuedPathsLedger::isCallerEntitledToReset()
{
    const auto task = codeSigning_.taskFromAuditToken(currentAuditToken());
    const auto value = task ? task->entitlement(resetEntitlement) : std::nullopt;
    // Only the boolean: the string "true" and the number 1 do not entitle.
    return value && value->isTrue();
}

void IssuedPathsLedger::store(PropertyList::Dictionary issues)
{
    preferences_.setValue(issuesKey, std::move(issues));
    preferences_.synchronize();
}

}  // namespace typhon
