#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"

#include <string>

namespace typhon {

/// A listening socket and what belongs to it.
struct ListeningSocket {
    FileDescriptor socket;
    /// A named socket: held for as long as it is ours.
    FileDescriptor lock;
    /// A named socket that was made here: where it is.
    std::string path;
    /// An anonymous socket: the `O_PATH` descriptor that others connect through.
    FileDescriptor endpoint;
    /// Set when there is no socket.
    std::string problem;
    /// True when that is because another process holds the name, which may be about to end.
    bool isTaken = false;
};

/// Where the socket of a service is.
std::string pathOfService(const RootDirectory& root, const std::string& name);

/// The socket of a service: the one that the service manager handed over under that name, else a new one.
/// What an earlier process left behind is replaced; a service that still runs is not.
ListeningSocket listenForService(const RootDirectory& root, const std::string& name);

/// A socket that only the holders of its endpoint can find.
ListeningSocket listenAnonymously(const RootDirectory& root);

}  // namespace typhon
