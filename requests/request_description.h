#pragma once

#include "platform/property_list.h"

#include <cstddef>
#include <string>

namespace typhon {

/// The requests as a text for the log, cut when it gets longer than that.
std::string descriptionOf(const PropertyList::Array& requests, std::size_t longest = 1000);

}  // namespace typhon
