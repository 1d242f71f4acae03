#pragma once

#include "platform/property_list.h"

#include <string>

namespace typhon {

/// A date in UTC, "2026-01-31T12:00:00Z", with a fraction only where there is one, to the microsecond.
std::string dateText(Date date);

}  // namespace typhon
