#pragma once

#include "platform/file_system.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>

namespace typhon {

/// What a property list from outside may cost. Whatever goes beyond is refused with an error.
struct PropertyListLimits {
    std::size_t bytes = 256u << 20;
    /// Nested containers.
    std::size_t depth = 128;
    /// Values in all, keys included.
    std::size_t values = 16u << 20;
};

/// Reads an XML or binary property list. Everything is checked: offsets, cycles, counts, duplicate keys,
/// text encoding. A document type declaration is skipped, no external entity is ever loaded, internal
/// entities are refused.
PropertyListReading readPropertyList(std::span<const std::uint8_t> bytes,
                                     const PropertyListLimits& limits = {});

/// The same from a stream, a block at a time for XML. `read` fills the span and returns how many bytes it
/// put there, 0 at the end, or -1 for an input error.
PropertyListReading
readPropertyListFromStream(const std::function<std::ptrdiff_t(std::span<std::uint8_t>)>& read,
                           const PropertyListLimits& limits = {});

/// The same from an open file, from its present offset.
PropertyListReading readPropertyListFromDescriptor(int descriptor, const PropertyListLimits& limits = {});

}  // namespace typhon
