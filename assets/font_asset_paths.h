#pragma once

#include "platform/log.h"

#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// The name of the asset directory that a font file of the asset store belongs to, or null for a path of
/// another shape; then the path or, for a file of the store that does not lie in an "AssetData" directory,
/// the directory that it lies in, is logged as an error.
std::optional<std::string> assetDirectoryNameOf(const std::string& path, Log& log);

/// The names for a list of paths, each once.
std::set<std::string, std::less<>> assetDirectoryNamesOf(const std::vector<std::string>& paths, Log& log);

}  // namespace typhon
