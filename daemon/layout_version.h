#pragma once

#include "platform/preferences.h"

#include <cstdint>
#include <functional>

namespace typhon {

/// The version of what the daemon keeps on the device, in the preference "version".
inline constexpr std::int64_t currentLayoutVersion = 3;

/// Brings an older layout up to date, once: removes what it left behind and stores the current version.
/// Does nothing for the current or a newer layout.
void migrateLayout(Preferences& preferences, const std::function<void()>& removeObsoleteFontAsset);

}  // namespace typhon
