#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

namespace typhon {

/// Size of the part of a message that tells the sizes of the others.
inline constexpr std::size_t messageHeaderSize = 16;

/// The number at `at` in a message, or in the beginning of one, in the byte order that its first byte tells.
inline std::uint32_t numberIn(std::span<const std::uint8_t> message, std::size_t at)
{
    const bool little = message[0] == 'l';
    std::uint32_t result = 0;
    for (std::size_t index = 0; index < 4; ++index) {
        result |= std::uint32_t{message[at + index]} << (8 * (little ? index : 3 - index));
    }
    return result;
}

}  // namespace typhon
