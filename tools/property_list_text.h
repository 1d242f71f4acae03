#pragma once

#include "platform/property_list.h"

#include <string>

namespace typhon {

/// A property list for people, on indented lines with a final newline: `key: value` for a dictionary, `-
/// value` for an array; text in quotation marks, data as its length and first bytes.
std::string propertyListText(const PropertyList& value);

}  // namespace typhon
