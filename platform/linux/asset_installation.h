#pragma once

#include "platform/linux/asset_catalogue.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace typhon {

/// The SHA-256 of the files that lie in a real folder, by name. Fails for a folder with anything else in it.
Result<std::map<std::string, Sha256>> digestsOfFolder(const std::string& folder);

/// Puts the files of an asset into an empty directory. Null, or why not.
using FillAsset = std::function<std::optional<std::string>(int directory, const ListedAsset& listed)>;

/// Copies them from a real folder.
FillAsset fromFolder(std::string folder);

/// The size of the largest file an asset may have.
inline constexpr std::uint64_t largestAssetFile = std::uint64_t{512} << 20;

/// Installs that asset in the real directory `store`: has its files put together, compares what is there then
/// with what is listed, and puts the asset in its place in one step, also of one that is installed. Null, or
/// why nothing was installed.
std::optional<std::string> installAsset(const std::string& store, const std::string& assetId,
                                        const ListedAsset& listed, const FillAsset& fill);

}  // namespace typhon
