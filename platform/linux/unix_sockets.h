#pragma once

#include "platform/linux/file_descriptor.h"

#include <string>

namespace typhon {

/// A socket, or why there is none.
struct SocketResult {
    FileDescriptor socket;
    std::string problem;
};

/// A stream socket that listens at `name` in the directory `directory`, connectable by everybody. Nothing may
/// be in its place. Path names may be longer than a socket address.
SocketResult listenAt(const std::string& directory, const std::string& name);

/// Connects to a socket by its path, of any length, without waiting for room in its backlog.
SocketResult connectToPath(const std::string& path);

/// Connects to the socket behind an `O_PATH` descriptor, without waiting for room in its backlog.
SocketResult connectToDescriptor(int descriptor);

}  // namespace typhon
