#pragma once

#include "platform/property_list.h"

#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace typhon {

/// The fields of one analytics event, as name and value: MESSAGE, PRIORITY (6), TYPHON_EVENT with the event's
/// name, and TYPHON_EVENT_<KEY> for every string, integer and boolean of the payload, the key in capitals.
/// Values are one line each, control characters made visible, and cut at 1 KiB.
using EventFields = std::vector<std::pair<std::string, std::string>>;
EventFields eventFields(std::string_view name, const PropertyList& payload);

/// The fields as the journal takes and exports them: lines of NAME=value.
std::string eventText(const EventFields& fields);

}  // namespace typhon
