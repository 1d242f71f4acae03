#include "fontmanager/font_store.h"

#include "fontmanager/directory_names.h"
#include "fontmanager/font_paths.h"
#include "platform/linux/directory_listing.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <map>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr mode_t directoryPermissions = 0755;
constexpr std::size_t mostFiles = 1U << 20;

bool isEnabled(const PropertyList& entry)
{
    const auto* disabled = entry.find("disabled");
    return disabled == nullptr || !disabled->isTrue();
}

/// Records a font and what that means for others.
std::optional<std::string> put(PropertyList::Dictionary& entries, const RegisteredFont& font,
                               RegistryChange& change)
{
    const auto before = entries.find(font.path);
    const bool wasEnabled = before != entries.end() && isEnabled(before->second);
    if (!font.disabled) {
        change.available.push_back(font.path);
    } else if (wasEnabled) {
        change.gone.push_back(font.path);
    }
    change.isRegistryChanged = true;
    return putFont(entries, font);
}

void drop(PropertyList::Dictionary& entries, const std::string& path, RegistryChange& change)
{
    if (entries.erase(path) > 0) {
        change.gone.push_back(path);
        change.isRegistryChanged = true;
    }
}

void prepend(const RegistryChange& earlier, RegistryChange& change)
{
    change.available.insert(change.available.begin(), earlier.available.begin(), earlier.available.end());
    change.gone.insert(change.gone.begin(), earlier.gone.begin(), earlier.gone.end());
    change.isRegistryChanged = change.isRegistryChanged || earlier.isRegistryChanged;
}

std::string notRegistered(const std::string& path)
{
    return visibleText(path) + " is not registered";
}

}  // namespace

FontStore::FontStore(RootDirectory root, ReadFontNames readNames, Log& log, RegistrationLimits limits)
    : root_(root), readNames_(std::move(readNames)), limits_(limits), log_(log), directories_(root),
      registry_(root), journal_(std::move(root))
{}

RegistryChangeOutcome FontStore::open()
{
    const std::lock_guard lock(mutex_);
    if (auto error = makeDirectories(root_.real(font_paths::userFonts), directoryPermissions)) {
        return {.change = {}, .error = std::move(error)};
    }
    lock_.emplace(root_.real(font_paths::writerLock));
    if (lock_->error()) {
        return {.change = {}, .error = *lock_->error() + "; another process changes the fonts already"};
    }
    const bool isUnreported = registry_.isUnreported();
    ++changesUnderWay_;
    auto outcome = completeInterruptedChange();
    outcome.change.isRegistryChanged = outcome.change.isRegistryChanged || isUnreported;
    if (!outcome.error) {
        sweepCopies();
    }
    return outcome;
}

FontStore::Beginning FontStore::begin(const std::string& identifier, bool enabled)
{
    const auto name = directoryNameFromIdentifier(identifier);
    if (!name) {
        return {nullptr, "no application can have the identifier \"" + visibleText(identifier, 300) + "\""};
    }
    auto opening = directories_.open(*name, true);
    if (!opening.lease) {
        return {nullptr, std::move(opening.error)};
    }
    Beginning beginning;
    const std::lock_guard lock(mutex_);
    beginning.registration =
        std::make_unique<FontRegistration>(std::move(opening.lease), enabled, ++serial_, readNames_, limits_);
    return beginning;
}

RegistryChangeOutcome FontStore::commit(FontRegistration& registration)
{
    if (auto error = registration.finish()) {
        return {.change = {}, .error = std::move(error)};
    }
    return inTurn([&] { return commitFiles(registration); });
}

RegistryChangeOutcome FontStore::commitFiles(FontRegistration& registration)
{
    PendingChange pending{.placements = registration.fonts(), .removals = {}};
    for (const auto& staged : pending.placements) {
        const auto name = font_paths::placeOfFontFile(staged.font.path)->name;
        struct stat status {};
        if (::fstatat(registration.directory(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
            S_ISDIR(status.st_mode)) {
            return {.change = {}, .error = visibleText(name) + ": a directory is in its place"};
        }
    }
    auto outcome = apply(pending, false);
    // Once it is in the journal, the change will be completed, by the next run at the latest.
    if (!outcome.error || journal_.read().change) {
        registration.release();
    }
    return outcome;
}

RegistryChangeOutcome FontStore::unregister(const std::vector<std::string>& paths)
{
    for (const auto& path : paths) {
        if (!font_paths::placeOfFontFile(path)) {
            return {.change = {}, .error = visibleText(path) + " is not a provider's font file"};
        }
    }
    return inTurn([&]() -> RegistryChangeOutcome {
        auto missing = registry_.update([&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
            const auto stranger =
                std::ranges::find_if(paths, [&](const auto& path) { return !entries.contains(path); });
            return stranger == paths.end() ? std::nullopt : std::optional(notRegistered(*stranger));
        });
        return missing ? RegistryChangeOutcome{.change = {}, .error = std::move(missing)}
                       : apply({.placements = {}, .removals = paths}, false);
    });
}

RegistryChangeOutcome FontStore::unregisterAll(const std::string& identifier)
{
    const auto directory = directoryNameFromIdentifier(identifier);
    return inTurn([&]() -> RegistryChangeOutcome {
        if (!directory) {
            // An identifier that has no directory has no fonts.
            return {};
        }
        PendingChange pending;
        const auto prefix = font_paths::fontFiles + *directory + "/";
        auto error = registry_.update([&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
            for (auto at = entries.lower_bound(prefix); at != entries.end() && at->first.starts_with(prefix);
                 ++at) {
                pending.removals.push_back(at->first);
            }
            return std::nullopt;
        });
        if (error || pending.removals.empty()) {
            return {.change = {}, .error = std::move(error)};
        }
        return apply(pending, false);
    });
}

RegistryChangeOutcome FontStore::setEnabled(const std::vector<std::string>& paths, bool enabled)
{
    return inTurn([&]() -> RegistryChangeOutcome {
        RegistryChange change;
        auto error = registry_.update([&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
            for (const auto& path : paths) {
                const auto found = entries.find(path);
                const auto* entry = found == entries.end() ? nullptr : found->second.asDictionary();
                if (entry == nullptr) {
                    return notRegistered(path);
                }
                if (isEnabled(found->second) == enabled) {
                    continue;
                }
                auto changed = *entry;
                changed.insert_or_assign("disabled", !enabled);
                found->second = std::move(changed);
                change.isRegistryChanged = true;
                (enabled ? change.available : change.gone).push_back(path);
            }
            return std::nullopt;
        });
        return {.change = error ? RegistryChange{} : std::move(change), .error = std::move(error)};
    });
}

RegistryChangeOutcome FontStore::synchronizeProviders()
{
    return inTurn([&]() -> RegistryChangeOutcome {
        RegistryChange change;
        auto error = registry_.update([&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
            std::vector<std::string> lost;
            for (const auto& [path, entry] : entries) {
                if (font_paths::placeOfFontFile(path) && !isFileThere(path)) {
                    lost.push_back(path);
                }
            }
            for (const auto& path : lost) {
                drop(entries, path, change);
            }
            return std::nullopt;
        });
        for (const auto& name : directories_.names()) {
            // Goes, if it is empty, when it is left.
            directories_.open(name, false);
        }
        return {.change = error ? RegistryChange{} : std::move(change), .error = std::move(error)};
    });
}

void FontStore::changeBegins()
{
    const std::lock_guard lock(mutex_);
    ++changesUnderWay_;
}

void FontStore::changeWasReported()
{
    const std::lock_guard lock(mutex_);
    if (--changesUnderWay_ > 0) {
        return;
    }
    registry_.wasReported();
    if (const auto error = eraseCompletedChange()) {
        TYLog_Error(log_, *error);
    }
}

/// Runs an operation under the lock, once no other change is left in its middle. What that brought about is
/// told with the outcome: whoever left it could not report it.
RegistryChangeOutcome FontStore::inTurn(const std::function<RegistryChangeOutcome()>& operation)
{
    const std::lock_guard lock(mutex_);
    auto earlier = completeInterruptedChange();
    if (!earlier.error) {
        // Completing it once more after another change would undo that one.
        earlier.error = eraseCompletedChange();
    }
    if (earlier.error) {
        return earlier;
    }
    auto outcome = operation();
    prepend(earlier.change, outcome.change);
    return outcome;
}

RegistryChangeOutcome FontStore::completeInterruptedChange()
{
    if (isJournalComplete_) {
        return {};
    }
    auto reading = journal_.read();
    if (!reading.change) {
        return {.change = {}, .error = std::move(reading.error)};
    }
    TYLog(log_, "completing a change of fonts that was interrupted");
    dropLostPlacements(*reading.change);
    return apply(std::move(*reading.change), true);
}

std::optional<std::string> FontStore::eraseCompletedChange()
{
    auto error = isJournalComplete_ ? journal_.erase() : std::nullopt;
    isJournalComplete_ = isJournalComplete_ && error;
    return error;
}

RegistryChangeOutcome FontStore::apply(PendingChange pending, bool isJournalled)
{
    RegistryChangeOutcome outcome;
    const auto edit = [&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
        for (const auto& staged : pending.placements) {
            if (auto error = put(entries, staged.font, outcome.change)) {
                return error;
            }
        }
        for (const auto& path : pending.removals) {
            // The run that was interrupted may have come as far as this, but not to its report.
            if (entries.erase(path) > 0 || isJournalled) {
                outcome.change.gone.push_back(path);
            }
        }
        outcome.change.isRegistryChanged = true;
        return std::nullopt;
    };
    const auto beforeReplacing = [&] {
        auto error = isJournalled ? std::nullopt : journal_.write(pending);
        return error ? error : place(pending);
    };
    outcome.error = registry_.update(edit, beforeReplacing);
    if (outcome.error) {
        outcome.change = {};
        return outcome;
    }
    removeFiles(pending.removals);
    isJournalComplete_ = true;
    return outcome;
}

std::optional<std::string> FontStore::place(const PendingChange& change)
{
    std::map<std::string, std::unique_ptr<ProviderDirectories::Lease>> leases;
    for (const auto& staged : change.placements) {
        const auto place = font_paths::placeOfFontFile(staged.font.path);
        auto& lease = leases[place->directory];
        if (!lease) {
            auto opening = directories_.open(place->directory, true);
            if (!opening.lease) {
                return opening.error;
            }
            lease = std::move(opening.lease);
        }
        // An interrupted change may have renamed it already; that it is there has been seen to.
        if (::renameat(lease->descriptor(), staged.temporary.c_str(), lease->descriptor(),
                       place->name.c_str()) != 0 &&
            errno != ENOENT) {
            const int error = errno;
            return "cannot put " + visibleText(place->name) + " in its place: " + errorText(error);
        }
    }
    for (const auto& [name, lease] : leases) {
        if (auto error = flushOpenDirectory(lease->descriptor(), name)) {
            return error;
        }
    }
    return std::nullopt;
}

void FontStore::removeFiles(const std::vector<std::string>& paths)
{
    std::map<std::string, std::unique_ptr<ProviderDirectories::Lease>> leases;
    for (const auto& path : paths) {
        const auto place = font_paths::placeOfFontFile(path);
        if (!place) {
            continue;
        }
        auto& lease = leases[place->directory];
        if (!lease) {
            lease = directories_.open(place->directory, false).lease;
        }
        if (lease && ::unlinkat(lease->descriptor(), place->name.c_str(), 0) != 0 && errno != ENOENT) {
            const int error = errno;
            TYLog_Error(log_, "cannot remove " + visibleText(path) + ": " + errorText(error));
        }
    }
    for (const auto& [name, lease] : leases) {
        const auto error = lease ? flushOpenDirectory(lease->descriptor(), name) : std::nullopt;
        if (error) {
            TYLog_Error(log_, *error);
        }
    }
}

bool FontStore::isFileThere(const std::string& path)
{
    const auto place = font_paths::placeOfFontFile(path);
    const auto opening = directories_.open(place->directory, false);
    struct stat status {};
    return opening.lease &&
           ::fstatat(opening.lease->descriptor(), place->name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0;
}

void FontStore::dropLostPlacements(PendingChange& change)
{
    std::erase_if(change.placements, [&](const StagedFont& staged) {
        const auto place = font_paths::placeOfFontFile(staged.font.path);
        const bool isLost = !isFileThere(font_paths::fontFiles + place->directory + "/" + staged.temporary) &&
                            !isFileThere(staged.font.path);
        if (isLost) {
            TYLog_Error(log_, visibleText(staged.font.path) + " was lost before it was registered");
        }
        return isLost;
    });
}

void FontStore::sweepCopies()
{
    // What comes of a registry or journal that was not written to its end; the next one would replace it too.
    const FileLock registryLock(root_.real(font_paths::registry) + ".lock");
    for (const char* path : {font_paths::registry, font_paths::journal}) {
        if (!registryLock.error()) {
            ::unlink((root_.real(path) + ".new").c_str());
        }
    }
    for (const auto& name : directories_.names()) {
        const auto opening = directories_.open(name, false);
        if (!opening.lease) {
            continue;
        }
        for (const auto& file : listDirectory(opening.lease->descriptor(), mostFiles).files) {
            if (file.starts_with(FontRegistration::temporaryPrefix)) {
                TYLog_Debug(log_, "removing the left-over copy " + name + "/" + visibleText(file));
                ::unlinkat(opening.lease->descriptor(), file.c_str(), 0);
            }
        }
    }
}

}  // namespace typhon
