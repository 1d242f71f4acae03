#pragma once

#include "platform/audit_token.h"
#include "platform/linux/file_descriptor.h"

namespace typhon {

/// The process at the other end of a connected socket, by its number, instance and user. Unlike the daemon's
/// tokens this one says nothing about the program, which an unprivileged process may not see of others.
/// All zero when the process is gone.
AuditToken instanceOfPeer(int socket);

/// A pidfd of the process of such a token, or none when it is gone.
FileDescriptor pidfdOfInstance(const AuditToken& token);

}  // namespace typhon
