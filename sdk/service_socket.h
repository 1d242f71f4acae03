#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"
#include "sdk/client_result.h"

#include <optional>
#include <string>
#include <string_view>

namespace typhon {

/// The root to use: `chosen`, else the environment's TYPHON_ROOT (ignored by programs that run with raised
/// privileges), else the machine's own. A relative folder is taken from the working directory.
RootDirectory chosenRoot(const std::optional<std::string>& chosen);

/// The real path of a service's socket.
std::string serviceSocketPath(const RootDirectory& root, std::string_view serviceName);

/// A connected stream socket to the Unix socket at `path`, of any length. Blocks until the service has room
/// for another connection.
ClientResult<FileDescriptor> connectToSocket(const std::string& path);

}  // namespace typhon
