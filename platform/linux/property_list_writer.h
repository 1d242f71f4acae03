#pragma once

#include "platform/property_list.h"

#include <cstdint>
#include <string>
#include <vector>

namespace typhon {

// Neither form carries everything that can be built in memory. Bytes that are no valid UTF-8 are replaced by
// U+FFFD each (of the keys that then coincide, the one that needed no replacement stays, else the first), and
// dates that are not finite or more than 2^53 seconds away are moved to the nearest that is.

/// The binary form. Equal values give equal bytes.
std::vector<std::uint8_t> writeBinaryPropertyList(const PropertyList& value);

/// The XML form, indented, with a document type declaration. Characters that XML cannot carry are replaced by
/// U+FFFD too. Fractions of a second are dropped.
std::string writeXmlPropertyList(const PropertyList& value);

}  // namespace typhon
