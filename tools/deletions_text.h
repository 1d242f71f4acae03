#pragma once

#include "platform/property_list.h"

#include <string>

namespace typhon {

/// The schedule of deletions as the preferences store it ("delete"): path to date. What is malformed is left
/// out.
PropertyList plainSchedule(const PropertyList& schedule);

/// A plain schedule for people, as a table in the order of its dates. `now` is seconds since the epoch.
std::string deletionsText(const PropertyList& schedule, double now);

}  // namespace typhon
