#pragma once

#include "sdk/font_change_notice.h"

#include <string>

#include <nlohmann/json.hpp>

namespace typhon {

/// A change of fonts as one line for people: which files came, with the names of their fonts as far as they
/// are known, or which went.
std::string changeText(const FontChangeNotice& change);

/// The same with everything that was told: "info", "addedURLStrings" and "removedURLStrings", each of which
/// may be null.
nlohmann::json changeJson(const FontChangeNotice& change);

}  // namespace typhon
