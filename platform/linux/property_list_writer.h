#pragma once

#include "platform/property_list.h"

#include <cstdint>
#include <string>
#include <vector>

namespace typhon {

/// The binary form. Equal values give equal bytes.
std::vector<std::uint8_t> writeBinaryPropertyList(const PropertyList& value);

/// The XML form, indented, with the usual document type declaration. Characters that XML cannot carry are
/// replaced by U+FFFD.
std::string writeXmlPropertyList(const PropertyList& value);

}  // namespace typhon
