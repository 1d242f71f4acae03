#pragma once

#include <cstdint>
#include <span>

namespace typhon {

/// True for a whole message whose header is surely valid: one of the kinds there are, little-endian, with the
/// fields it must have, each once, well-formed and in its own type, and without descriptors. Stricter than
/// sd-bus, which understands whatever is plain; what is not plain may be valid all the same. The body is not
/// looked at, nor does sd-bus look at it before it hands the message out.
bool isPlainMessage(std::span<const std::uint8_t> message);

}  // namespace typhon
