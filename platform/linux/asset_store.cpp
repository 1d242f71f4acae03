#include "platform/linux/asset_store.h"

#include "platform/asset_service.h"
#include "platform/linux/asset_installation.h"
#include "platform/linux/directory_listing.h"
#include "platform/linux/directory_removal.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <algorithm>
#include <cerrno>

#include <fcntl.h>
#include <linux/openat2.h>
#include <unistd.h>

// An asset is there when its directory has its name, and whole then: it is put together under a name that
// begins with a dot and renamed, and to go it is renamed first.

namespace typhon {

namespace {

constexpr const char* assetsDirectory = "/private/var/Cargon/AssetsV2/";
constexpr mode_t directoryPermissions = 0755;
constexpr mode_t filePermissions = 0644;
constexpr std::size_t mostAssets = 1U << 16;
constexpr PropertyListLimits attributeLimits{.bytes = 4 << 20, .depth = 16, .values = 256 * 1024};
constexpr int directoryFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;

PropertyList::Dictionary attributesOf(int store, const std::string& assetId)
{
    const auto opened = openRegularFile(assetId + "/Info.plist", store,
                                        RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS);
    const auto reading = opened.error == 0
                             ? readPropertyListFromDescriptor(opened.file.get(), attributeLimits)
                             : PropertyListReading{};
    const auto* attributes = reading.value ? reading.value->asDictionary() : nullptr;
    return attributes == nullptr ? PropertyList::Dictionary{} : *attributes;
}

std::string withUnderscores(std::string assetType)
{
    std::ranges::replace(assetType, '.', '_');
    return assetType;
}

}  // namespace

std::string AssetStore::directoryOfType(const std::string& assetType) const
{
    return root_.real(assetsDirectory + withUnderscores(assetType));
}

std::string AssetStore::fileOfCatalogue(const std::string& assetType) const
{
    return root_.real(assetsDirectory + std::string("Catalogues/") + withUnderscores(assetType) + ".plist");
}

Result<AssetCatalogue> AssetStore::catalogue(const std::string& assetType)
{
    const auto opened = openRegularFile(fileOfCatalogue(assetType));
    if (opened.error != 0) {
        return {std::nullopt, opened.errorText()};
    }
    const auto contents = readWhole(opened.file.get(), catalogueFileLimit);
    auto catalogue = contents.error == 0 ? decodeCatalogue(contents.bytes, *keys_.current())
                                         : Result<AssetCatalogue>{std::nullopt, errorText(contents.error)};
    if (catalogue.value && catalogue.value->assetType != assetType) {
        catalogue = {std::nullopt, "it is for another type"};
    }
    if (!catalogue.value) {
        TYLog_Error(log_, "the catalogue of " + assetType + " does not count: " + catalogue.error);
    }
    return catalogue;
}

AssetStore::Listing AssetStore::assets(const std::string& assetType)
{
    Listing result;
    auto listed = catalogue(assetType);
    const FileDescriptor store(::open(directoryOfType(assetType).c_str(), directoryFlags));
    if (!store && errno != ENOENT) {
        return {{}, "cannot open the store: " + errorText(errno)};
    }
    result.isCatalogueBroken = !listed.value && ::access(fileOfCatalogue(assetType).c_str(), F_OK) == 0;
    const auto installed = store ? listDirectory(store.get(), mostAssets) : DirectoryListing{};
    for (const auto& assetId : installed.directories) {
        if (!isValidAssetId(assetId)) {
            continue;
        }
        const bool isListed = !listed.value || listed.value->assets.erase(assetId) > 0;
        result.assets.push_back({assetId, isListed ? asset_states::installed : asset_states::obsolete,
                                 attributesOf(store.get(), assetId)});
    }
    for (auto& [assetId, asset] : listed.value ? listed.value->assets : decltype(AssetCatalogue::assets){}) {
        result.assets.push_back({assetId, asset_states::listed, asset.attributes});
    }
    std::ranges::sort(result.assets, {}, &StoredAsset::assetId);
    return result;
}

std::optional<std::uint64_t> AssetStore::sizeOf(const std::string& assetType,
                                                const std::string& assetId) const
{
    const auto path = directoryOfType(assetType) + "/" + assetId + "/AssetData";
    const FileDescriptor data(isValidAssetId(assetId) ? ::open(path.c_str(), directoryFlags) : -1);
    if (!data) {
        return std::nullopt;
    }
    std::uint64_t size = 0;
    for (const auto& name : listDirectory(data.get(), mostAssets).files) {
        struct stat status {};
        if (::fstatat(data.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) {
            size += static_cast<std::uint64_t>(status.st_size);
        }
    }
    return size;
}

std::optional<std::string> AssetStore::replaceCatalogue(const std::string& assetType, const Bytes& contents)
{
    const auto path = fileOfCatalogue(assetType);
    const auto refuse = [&](const std::string& reason) {
        TYLog_Error(log_, "a new catalogue of " + assetType + " is refused: " + reason);
        return std::optional(reason);
    };
    const auto fresh = decodeCatalogue(contents, *keys_.current());
    if (!fresh.value) {
        return refuse(fresh.error);
    }
    if (fresh.value->assetType != assetType) {
        return refuse("it is for another type");
    }
    if (auto error = makeDirectories(directoryOf(path), directoryPermissions)) {
        return refuse(*error);
    }
    const FileLock lock(path + ".lock");
    if (lock.error()) {
        return refuse(*lock.error());
    }
    const bool isThere = ::access(path.c_str(), F_OK) == 0;
    const auto present = isThere ? catalogue(assetType) : Result<AssetCatalogue>{};
    if (present.value && present.value->version > fresh.value->version) {
        return refuse("it is older than the present one");
    }
    auto error = replaceFile(path, contents, filePermissions);
    return error ? refuse(*error) : std::nullopt;
}

std::optional<std::string> AssetStore::install(const std::string& assetType, const std::string& assetId,
                                               const FillAsset& fill)
{
    const auto listed = catalogue(assetType);
    if (!listed.value) {
        return "there is no catalogue of " + assetType + " that counts: " + listed.error;
    }
    const auto found = listed.value->assets.find(assetId);
    if (found == listed.value->assets.end()) {
        return visibleText(assetId, 300) + " is not in the catalogue of " + assetType;
    }
    const auto store = directoryOfType(assetType);
    if (auto error = makeDirectories(store, directoryPermissions)) {
        return error;
    }
    return installAsset(store, assetId, found->second, fill);
}

std::optional<std::string> AssetStore::purge(const std::string& assetType, const std::string& assetId)
{
    const FileDescriptor store(::open(directoryOfType(assetType).c_str(), directoryFlags));
    if (!store || !isValidAssetId(assetId)) {
        return visibleText(assetId, 300) + " is not installed";
    }
    const auto going = ".purging-" + assetId;
    // Of a purge that was interrupted.
    if (auto error = ::faccessat(store.get(), going.c_str(), F_OK, AT_SYMLINK_NOFOLLOW) == 0
                         ? removeEntry(store.get(), going)
                         : std::nullopt) {
        return error;
    }
    if (::renameat(store.get(), assetId.c_str(), store.get(), going.c_str()) != 0) {
        return errno == ENOENT ? visibleText(assetId, 300) + " is not installed" : errorText(errno);
    }
    ::fsync(store.get());
    return removeEntry(store.get(), going);
}

}  // namespace typhon
