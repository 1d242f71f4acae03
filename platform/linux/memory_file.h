#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/log.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

namespace typhon {

/// An empty memory file to write to, or none when the system has no memory files.
FileDescriptor emptyMemoryFile();

/// Seals it against all changes, forever. False when somebody still has it mapped for writing.
bool sealMemoryFile(int memoryFile);

/// A sealed memory file with these bytes, or none when the system has no memory files or no room.
FileDescriptor sealedMemoryFile(std::span<const std::uint8_t> bytes);

/// Another open description of the same memory file, read-only and with an offset of its own.
FileDescriptor reopenedReadOnly(int memoryFile);

/// The contents of a memory file received from somebody else, or null when it is not one, is not sealed
/// against writing and resizing, or is larger than `limit`.
std::optional<std::vector<std::uint8_t>> contentsOfSealedMemoryFile(int descriptor, std::size_t limit);

/// Says in the log when this system has no memory files, in the way of which large values travel.
void logMissingMemoryFiles(Log& log);

}  // namespace typhon
