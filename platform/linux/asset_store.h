#pragma once

#include "platform/linux/asset_catalogue.h"
#include "platform/linux/asset_installation.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// An asset that is listed, installed or both.
struct StoredAsset {
    std::string assetId;
    /// One of `asset_states`.
    std::int64_t state = 0;
    PropertyList::Dictionary attributes;
};

/// The assets below /private/var/Cargon/AssetsV2/: a directory for each type (its dots as underscores), in it
/// a directory for each installed asset, with its attributes in "Info.plist" and its files in "AssetData";
/// beside them the catalogue of each type, as "Catalogues/<type>.plist". Any thread, any process; blocks on
/// the disk.
class AssetStore {
public:
    /// Both outlive this.
    AssetStore(const RootDirectory& root, Log& log)
        : root_(root), log_(log), keys_(root, log, catalogueKeysDirectory)
    {}

    struct Listing {
        std::vector<StoredAsset> assets;
        std::optional<std::string> error;
        /// True when there is a catalogue, and it does not count: nobody knows what is listed.
        bool isCatalogueBroken = false;
    };
    /// The assets of a type, by identifier. Without a catalogue that counts, every installed one is as good
    /// as listed: nothing may be removed because a catalogue is missing or broken.
    Listing assets(const std::string& assetType);

    /// How many bytes the files of an installed asset have; null for one that is not installed.
    std::optional<std::uint64_t> sizeOf(const std::string& assetType, const std::string& assetId) const;

    /// The present catalogue of a type, if it counts; null with an error otherwise.
    Result<AssetCatalogue> catalogue(const std::string& assetType);

    /// Makes these bytes the catalogue of the type they are for, in one step, unless they are not signed by a
    /// key that counts, are for another type, or are older than the present one. Null, or why not.
    std::optional<std::string> replaceCatalogue(const std::string& assetType, const Bytes& contents);

    /// Installs that asset, in one step. Its files have to be what the catalogue says, no more and no less.
    /// Null, or why not.
    std::optional<std::string> install(const std::string& assetType, const std::string& assetId,
                                       const FillAsset& fill);
    /// The same with the files of a real folder; what else is in it does not matter.
    std::optional<std::string> install(const std::string& assetType, const std::string& assetId,
                                       const std::string& folder)
    {
        return install(assetType, assetId, fromFolder(folder));
    }

    /// Removes an installed asset, in one step. Null, or why not.
    std::optional<std::string> purge(const std::string& assetType, const std::string& assetId);

private:
    std::string directoryOfType(const std::string& assetType) const;
    std::string fileOfCatalogue(const std::string& assetType) const;

    const RootDirectory& root_;
    Log& log_;
    TrustedKeys keys_;
};

}  // namespace typhon
