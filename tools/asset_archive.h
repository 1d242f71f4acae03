#pragma once

#include "platform/linux/asset_installation.h"

#include <string>

namespace typhon {

/// Takes the files of an asset out of a tar archive, which may be compressed: plain files, by themselves or
/// in one folder of the asset's name, each listed and none twice. Anything else in it is refused. What reads
/// the archive is a process of its own that can do nothing but that.
FillAsset fromArchive(std::string archive, std::string assetId);

}  // namespace typhon
