#include "fontmanager/font_assets.h"

#include "fontmanager/font_asset_files.h"
#include "fontmanager/font_paths.h"
#include "fontmanager/profile_fonts.h"
#include "platform/font_directories.h"
#include "platform/linux/directory_listing.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <cerrno>

#include <fcntl.h>
#include <linux/openat2.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr mode_t directoryPermissions = 0755;
constexpr std::size_t mostAssets = 1U << 16;
constexpr std::size_t mostFiles = 4096;
constexpr int directoryFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
const std::string fontAssets(font_directories::fontAssets);

bool isAssetName(const std::string& name)
{
    return !name.empty() && name.front() != '.' && name == visibleText(name);
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
    const FileDescriptor store(::open(root_.real(font_directories::assetStore).c_str(), directoryFlags));
    if (!store && errno != ENOENT) {
        return {.change = {}, .error = "cannot open the asset store: " + errorText(errno)};
    }
    if (auto error = makeDirectories(root_.real(fontAssets), directoryPermissions)) {
        return {.change = {}, .error = std::move(error)};
    }
    const auto before = readFontRecord(root_, font_paths::registry);
    Plan plan;
    RegistryChangeOutcome outcome;
    if (store) {
        const auto listing = listDirectory(store.get(), mostAssets);
        if (listing.error != 0) {
            return {.change = {}, .error = "cannot list the asset store: " + errorText(listing.error)};
        }
        for (const auto& asset : listing.directories) {
            auto error = isAssetName(asset) ? planAsset(store.get(), asset, *before.asDictionary(), plan)
                                            : std::nullopt;
            if (error && !outcome.error) {
                outcome.error = asset + ": " + *error;
            }
        }
    }
    if (auto error = register_(plan, outcome.change)) {
        return {.change = {}, .error = std::move(error)};
    }
    removeUnwanted(plan.wanted);
    return outcome;
}

/// An error is the disk's, and leaves out the rest of this asset only.
std::optional<std::string> FontAssets::planAsset(int store, const std::string& asset,
                                                 const PropertyList::Dictionary& before, Plan& plan)
{
    const FileDescriptor data(::openat(store, (asset + "/AssetData").c_str(), directoryFlags));
    if (!data) {
        return std::nullopt;
    }
    const auto place = fontAssets + asset;
    if (auto error = makeDirectories(root_.real(place), directoryPermissions)) {
        return error;
    }
    const FileDescriptor directory(::open(root_.real(place).c_str(), directoryFlags));
    if (!directory) {
        return errorText(errno);
    }
    bool hasPlaced = false;
    for (const auto& name : listDirectory(data.get(), mostFiles).files) {
        const auto path = place + "/" + name;
        if (font_paths::objectionToFontFileName(name)) {
            continue;
        }
        const auto opened =
            openRegularFile(name, data.get(), RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS);
        if (opened.error == 0 && before.contains(path) &&
            isPlacedAssetFile(opened.status, directory.get(), name)) {
            plan.kept.insert(path);
            plan.wanted[asset].insert(name);
            continue;
        }
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

void FontAssets::removeUnwanted(const Files& wanted)
{
    const FileDescriptor all(::open(root_.real(fontAssets).c_str(), directoryFlags));
    if (!all) {
        return;
    }
    for (const auto& asset : listDirectory(all.get(), mostAssets).directories) {
        const FileDescriptor directory(::openat(all.get(), asset.c_str(), directoryFlags));
        const auto found = wanted.find(asset);
        for (const auto& name : listDirectory(directory.get(), mostFiles).files) {
            if (found == wanted.end() || !found->second.contains(name)) {
                ::unlinkat(directory.get(), name.c_str(), 0);
            }
        }
        if (found == wanted.end()) {
            // Stays where something else is in it.
            ::unlinkat(all.get(), asset.c_str(), AT_REMOVEDIR);
        }
    }
}

}  // namespace typhon
