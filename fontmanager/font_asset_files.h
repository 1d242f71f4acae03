#pragma once

#include <optional>
#include <string>

#include <sys/stat.h>

namespace typhon {

/// Puts the open regular file `from`, with that status, under `name` in an open directory, in one step in
/// place of what is there: by a hard link, else by sharing its blocks, else as a copy, flushed. Both
/// descriptors stay the caller's. Null, or why it failed.
std::optional<std::string> placeAssetFile(int from, const struct stat& status, int directory,
                                          const std::string& name);

/// True when `name` in the directory is what `placeAssetFile` made of the file with that status.
bool isPlacedAssetFile(const struct stat& status, int directory, const std::string& name);

}  // namespace typhon
