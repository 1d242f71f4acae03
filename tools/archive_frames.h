#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace typhon {

// What the process that reads an archive writes to its pipe, and the only thing that is known of it: frames
// of a kind, a length and that many bytes.

enum class ArchiveFrameKind : std::uint8_t {
    /// The name of the next file.
    file = 1,
    /// The next bytes of that file.
    data = 2,
    /// Why there is no more, for people.
    error = 3,
    /// There is no more.
    end = 4,
};

struct ArchiveFrame {
    ArchiveFrameKind kind = ArchiveFrameKind::end;
    std::string bytes;
};

inline constexpr std::size_t longestArchiveFrame = 64 << 10;

/// False when nobody reads any more.
bool writeArchiveFrame(int pipe, ArchiveFrameKind kind, std::string_view bytes);

/// Waits for the next frame; null for anything else, the end of the pipe included.
std::optional<ArchiveFrame> readArchiveFrame(int pipe);

}  // namespace typhon
