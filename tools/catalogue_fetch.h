#pragma once

#include "platform/linux/root_directory.h"
#include "sdk/client_result.h"

#include <string>

namespace typhon {

/// Fetches the catalogue of a type from its source, puts it in place if it counts, and announces that; the
/// text says what is left to tell. Blocks until that is done.
ClientResult<std::string> fetchCatalogue(const RootDirectory& root, const std::string& assetType);

}  // namespace typhon
