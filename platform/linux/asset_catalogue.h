#pragma once

#include "platform/linux/signing.h"
#include "platform/linux/trusted_keys.h"
#include "platform/property_list.h"

#include <cstdint>
#include <map>
#include <span>
#include <string>
#include <string_view>

namespace typhon {

/// The keys that may sign catalogues; a logical path. In the form of the keys for programs; "identifiers", if
/// given, are the beginnings of the asset types that the key may sign for.
inline constexpr const char* catalogueKeysDirectory = "/etc/typhon/catalogue-keys.d";
inline constexpr std::size_t catalogueFileLimit = 64 << 20;

/// An asset as a catalogue lists it.
struct ListedAsset {
    PropertyList::Dictionary attributes;
    /// The files of its "AssetData" by name.
    std::map<std::string, Sha256> files;
};

/// The assets of one type that there are.
struct AssetCatalogue {
    std::string assetType;
    std::int64_t version = 0;
    /// By asset identifier, which is the name of the asset's directory.
    std::map<std::string, ListedAsset> assets;
};

/// One plain visible path component that can be an asset's directory.
bool isValidAssetId(std::string_view assetId);

/// The contents of a catalogue file. Fails for what would not be read again.
Result<Bytes> makeCatalogue(const SigningKey& key, const AssetCatalogue& catalogue);

/// The catalogue in a file, if one of the keys signed it and may sign for its type.
Result<AssetCatalogue> decodeCatalogue(std::span<const std::uint8_t> bytes,
                                       const std::vector<TrustedKey>& keys);

}  // namespace typhon
