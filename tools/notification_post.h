#pragma once

#include "platform/linux/root_directory.h"
#include "platform/property_list.h"
#include "sdk/client_result.h"

#include <optional>
#include <string>

namespace typhon {

/// Posts a notification to the whole system, through the announcing service on the system's bus: with user
/// info a distributed one, without it a notify-centre one. Waits until it was announced.
ClientResult<Done> postNotification(const RootDirectory& root, const std::string& name,
                                    const std::optional<PropertyList>& userInfo);

}  // namespace typhon
