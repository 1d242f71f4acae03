#pragma once

#include "platform/linux/asset_catalogue.h"

#include <optional>
#include <string>

namespace typhon {

/// The SHA-256 of the files that lie in a real folder, by name. Fails for a folder with anything else in it.
Result<std::map<std::string, Sha256>> digestsOfFolder(const std::string& folder);

/// Installs the files of `folder` as that asset in the real directory `store`: copies them, compares what was
/// copied with what is listed, and puts the asset in its place in one step, also of one that is installed.
/// Null, or why nothing was installed.
std::optional<std::string> installAsset(const std::string& store, const std::string& assetId,
                                        const ListedAsset& listed, const std::string& folder);

}  // namespace typhon
