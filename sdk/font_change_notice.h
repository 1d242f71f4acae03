#pragma once

#include "platform/property_list.h"

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// What the daemon told this program of a change of fonts
/// (`fontAddedInfo:addedURLStrings:removedURLStrings:`).
struct FontChangeNotice {
    /// The fonts that came, and what is needed to use them: "fontsInfo" (path to entry) and, for some,
    /// "extension.provider". Empty or null for fonts that went.
    std::optional<PropertyList> info;
    /// The file URLs of the fonts that came, else null.
    std::optional<std::vector<std::string>> addedURLStrings;
    /// The file URLs of the fonts that went, else null.
    std::optional<std::vector<std::string>> removedURLStrings;
};

}  // namespace typhon
