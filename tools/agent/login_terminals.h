#pragma once

#include "platform/linux/file_descriptor.h"

#include <cstdint>
#include <map>
#include <string>

#include <sys/types.h>

namespace typhon {

/// The terminals of a user's login sessions: those that control a session whose leader is the user's. By
/// device number as /proc shows it, with the path of the device.
std::map<std::uint32_t, std::string> loginTerminals(uid_t user);

/// The device under /dev of a terminal, or empty for one that is neither a pseudo-terminal, a virtual console
/// nor a serial line.
std::string terminalPath(std::uint32_t device);

/// A descriptor of the terminal, open for reading and writing without becoming anybody's controlling one, or
/// none. To be closed soon: a pseudo-terminal does not end while it is held.
FileDescriptor openTerminal(const std::string& path);

}  // namespace typhon
