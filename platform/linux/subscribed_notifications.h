#pragma once

#include "platform/linux/root_directory.h"

#include <optional>
#include <set>
#include <string>

namespace typhon {

/// Which notifications the daemon is to be handed, by event stream; a logical path.
inline constexpr const char* subscriptionsFile = "/etc/typhon/notifications.d/com.vorlan.typhond.plist";

/// The names subscribed on a stream; null for all of them, as where nobody has said. Reads the disk.
std::optional<std::set<std::string>> subscribedNotifications(const RootDirectory& root,
                                                             const std::string& stream);

}  // namespace typhon
