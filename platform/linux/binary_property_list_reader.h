#pragma once

#include "platform/linux/property_list_reader.h"

#include <cstdint>
#include <span>

namespace typhon {

/// Reads the binary form. An object that is referenced several times becomes one shared value, but counts
/// against `limits` each time, with all that is in it: both its values and the bytes of its text and data.
PropertyListReading readBinaryPropertyList(std::span<const std::uint8_t> bytes,
                                           const PropertyListLimits& limits);

}  // namespace typhon
