#pragma once

#include "platform/audit_token.h"

namespace typhon {

/// The token of the process at the other end of a connected Unix socket: who connected, or who called
/// `listen`. All zero when that process is gone, out of sight or cannot be identified. Any thread.
AuditToken tokenOfPeer(int socket);

/// The token of the process behind a pidfd as it is now; all zero when it is gone or cannot be identified.
AuditToken tokenOfProcess(int pidfd);

}  // namespace typhon
