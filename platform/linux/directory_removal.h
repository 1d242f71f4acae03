#pragma once

#include "platform/linux/file_descriptor.h"

#include <optional>
#include <string>

namespace typhon {

/// Opens the directory at `path` relative to the open directory `top`: beneath it, through no symbolic link
/// and onto no other file system. `flags` as for open. None with errno set when that is not possible.
FileDescriptor openDirectoryBeneath(int top, const std::string& path, int flags);

/// Deletes what has that name in the open directory `parent`: a file, a symbolic link itself, or a directory
/// with its contents, to a bounded depth. Stays on the directory's file system. Null, or why it failed.
std::optional<std::string> removeEntry(int parent, const std::string& name);

}  // namespace typhon
