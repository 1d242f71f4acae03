#include "fontmanager/font_assets.h"

#include "fontmanager/font_asset_files.h"
#include "fontmanager/font_paths.h"
#include "fontmanager/profile_fonts.h"
#include "platform/font_directories.h"
#include "platform/linux/directory_listing.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <cerrno>

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr mode_t directoryPermissions = 0755;
constexpr std::size_t mostAssets = 1U << 16;
constexpr std::size_t mostFiles = 4096;
/// Of one synchronisation, when assets come all the time.
constexpr unsigned mostRuns = 4;
constexpr int directoryFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
const std::string fontAssets(font_directories::fontAssets);

bool isAssetName(const std::string& name)
{
    return !name.empty() && name.front() != '.' && name == visibleText(name);
}

struct MadeDirectory {
    FileDescriptor directory;
    /// Why there is none.
    std::string error;
};

/// Opens `name`, the directory `path`, in an open directory. Made when it is missing.
MadeDirectory openMadeDirectory(const std::string& path, int in, const std::string& name)
{
    FileDescriptor directory(::openat(in, name.c_str(), directoryFlags));
    if (!directory && errno == ENOENT) {
        if (auto error = makeDirectories(path, directoryPermissions)) {
            return {{}, std::move(*error)};
        }
        directory = FileDescriptor(::openat(in, name.c_str(), directoryFlags));
    }
    return directory ? MadeDirectory{std::move(directory), {}} : MadeDirectory{{}, errorText(errno)};
}

MadeDirectory openMadeDirectory(const std::string& path)
{
    return openMadeDirectory(path, AT_FDCWD, path);
}

/// To one that failed or is not whole.
std::string objectionTo(const DirectoryListing& listing)
{
    return listing.error != 0 ? errorText(listing.error) : "it holds too many names";
}

/// A path that came and went, or went and came, stands where it was last.
void addLater(RegistryChange& change, const RegistryChange& later)
{
    const auto move = [](std::vector<std::string>& to, std::vector<std::string>& from,
                         const std::vector<std::string>& paths) {
        const std::set<std::string> moved(paths.begin(), paths.end());
        std::erase_if(from, [&](const auto& path) { return moved.contains(path); });
        to.insert(to.end(), paths.begin(), paths.end());
    };
    move(change.available, change.gone, later.available);
    move(change.gone, change.available, later.gone);
    change.isRegistryChanged |= later.isRegistryChanged;
}

/// True when the file of that name in `data` has been placed in `directory` as it is now.
bool isInPlace(int data, int directory, const std::string& name)
{
    struct stat status {};
    return ::fstatat(data, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISREG(status.st_mode) &&
           isPlacedAssetFile(status, directory, name);
}

bool isDisabled(const PropertyList::Dictionary& entries, const std::string& path)
{
    const auto found = entries.find(path);
    const auto* disabled = found == entries.end() ? nullptr : found->second.find("disabled");
    return disabled != nullptr && disabled->isTrue();
}

}  // namespace

RegistryChangeOutcome FontAssets::synchronize()
{
    const std::lock_guard lock(mutex_);
    RegistryChangeOutcome outcome;
    unsigned runs = 0;
    // What came meanwhile is taken in too: nobody else may ever say that it came, while nobody watches yet.
    while (runs < mostRuns && synchronizeOnce(outcome)) {
        ++runs;
    }
    return outcome;
}

/// Adds to the outcome. True when all went well and assets came or went meanwhile.
bool FontAssets::synchronizeOnce(RegistryChangeOutcome& outcome)
{
    const FileDescriptor store(::open(root_.real(font_directories::assetStore).c_str(), directoryFlags));
    if (!store && errno != ENOENT) {
        outcome.error = "cannot open the asset store: " + errorText(errno);
        return false;
    }
    const auto listing = store ? listDirectory(store.get(), mostAssets) : DirectoryListing{};
    if (listing.error != 0 || listing.isCut) {
        outcome.error = "cannot list the asset store: " + objectionTo(listing);
        return false;
    }
    const auto placed = openMadeDirectory(root_.real(fontAssets));
    if (!placed.directory) {
        outcome.error = placed.error;
        return false;
    }
    const auto before = readFontRecord(root_, font_paths::registry);
    Plan plan;
    for (const auto& asset : listing.directories) {
        auto error = isAssetName(asset) ? planAsset({store.get(), placed.directory.get()}, asset,
                                                    *before.asDictionary(), plan)
                                        : std::nullopt;
        if (error) {
            keepAsItIs(asset, *before.asDictionary(), plan);
            outcome.error = outcome.error.value_or(asset + ": " + *error);
        }
    }
    RegistryChange change;
    if (auto error = register_(plan, change)) {
        outcome.error = std::move(error);
        return false;
    }
    removeUnwanted(placed.directory.get(), plan.wanted);
    addLater(outcome.change, change);
    struct stat status {};
    return !outcome.error && ::fstat(store.get(), &status) == 0 && FileIdentity(status) != listing.identity;
}

/// An error is the disk's, and leaves the rest of this asset as it is.
std::optional<std::string> FontAssets::planAsset(Directories directories, const std::string& asset,
                                                 const PropertyList::Dictionary& before, Plan& plan)
{
    const FileDescriptor data(::openat(directories.store, (asset + "/AssetData").c_str(), directoryFlags));
    if (!data) {
        const bool isNoAsset = errno == ENOENT || errno == ENOTDIR || errno == ELOOP;
        return isNoAsset ? std::nullopt : std::optional(errorText(errno));
    }
    const auto place = fontAssets + asset;
    const auto [directory, problem] = openMadeDirectory(root_.real(place), directories.placed, asset);
    if (!directory) {
        return problem;
    }
    const auto listing = listDirectory(data.get(), mostFiles);
    if (listing.error != 0 || listing.isCut) {
        return objectionTo(listing);
    }
    bool hasPlaced = false;
    for (const auto& name : listing.files) {
        const auto path = place + "/" + name;
        if (font_paths::objectionToFontFileName(name)) {
            continue;
        }
        if (before.contains(path) && isInPlace(data.get(), directory.get(), name)) {
            plan.kept.insert(path);
            plan.wanted[asset].insert(name);
            continue;
        }
        const auto opened =
            openRegularFile(name, data.get(), RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS);
        auto names = opened.error == 0 ? readNames_(opened.file.get())
                                       : FontNamesReading{.familyNames = {}, .error = opened.errorText()};
        if (!names.familyNames) {
            TYLog_Error(log_, "the asset font " + visibleText(path) + " is left out: " + names.error);
            continue;
        }
        if (auto error = placeAssetFile(opened.file.get(), opened.status, directory.get(), name)) {
            return error;
        }
        hasPlaced = true;
        plan.wanted[asset].insert(name);
        plan.placed.push_back(
            {path, {names.familyNames->begin(), names.familyNames->end()}, isDisabled(before, path)});
    }
    return hasPlaced ? flushDirectory(root_.real(place)) : std::nullopt;
}

void FontAssets::keepAsItIs(const std::string& asset, const PropertyList::Dictionary& before, Plan& plan)
{
    const auto directory = fontAssets + asset + "/";
    for (auto at = before.lower_bound(directory); at != before.end() && at->first.starts_with(directory);
         ++at) {
        plan.kept.insert(at->first);
        plan.wanted[asset].insert(at->first.substr(directory.size()));
    }
}

std::optional<std::string> FontAssets::register_(const Plan& plan, RegistryChange& change)
{
    return registry_.update([&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
        auto wanted = plan.kept;
        for (const auto& font : plan.placed) {
            wanted.insert(font.path);
            if (auto error = putFont(entries, font)) {
                return error;
            }
            if (!font.disabled) {
                change.available.push_back(font.path);
            }
            change.isRegistryChanged = true;
        }
        for (auto at = entries.lower_bound(fontAssets);
             at != entries.end() && at->first.starts_with(fontAssets);) {
            if (wanted.contains(at->first)) {
                ++at;
                continue;
            }
            change.gone.push_back(at->first);
            change.isRegistryChanged = true;
            at = entries.erase(at);
        }
        return std::nullopt;
    });
}

void FontAssets::removeUnwanted(int placed, const Files& wanted)
{
    for (const auto& asset : listDirectory(placed, mostAssets).directories) {
        const FileDescriptor directory(::openat(placed, asset.c_str(), directoryFlags));
        const auto found = wanted.find(asset);
        for (const auto& name : listDirectory(directory.get(), mostFiles).files) {
            if (found == wanted.end() || !found->second.contains(name)) {
                ::unlinkat(directory.get(), name.c_str(), 0);
            }
        }
        if (found == wanted.end()) {
            // Stays where something else is in it.
            ::unlinkat(placed, asset.c_str(), AT_REMOVEDIR);
        }
    }
}

}  // namespace typhon
