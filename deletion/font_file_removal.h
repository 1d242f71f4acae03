#pragma once

#include "platform/file_system.h"
#include "platform/log.h"

#include <string>
#include <vector>

namespace typhon {

/// Deletes font files in the two font trees, and the folders that this leaves empty. `paths` begin with one
/// of the trees' prefixes and may be hostile beyond that. Kept are files of font assets that the system's
/// asset store still holds. What fails is logged and left alone. Blocks on the disk.
void removeFontFiles(FileSystem& files, Log& log, const std::vector<std::string>& paths);

}  // namespace typhon
