#pragma once

#include "platform/audit_token.h"
#include "platform/linux/file_descriptor.h"

#include <memory>
#include <optional>
#include <string>

namespace typhon {

/// What holds a process in.
struct Confinement {
    /// True as well when it cannot be told.
    bool isSandboxed = true;
    /// It lives in another process namespace than the host's, or that cannot be told.
    bool hasOwnProcessNamespace = true;
    /// It lives in another user namespace than the host's, or that cannot be told.
    bool hasOwnUserNamespace = true;
    /// It has another root directory than the host, or the same on another mount, or that cannot be told.
    bool hasOwnRoot = true;
};

/// What was seen of a process.
struct SeenOfProcess {
    /// The text of its /proc/PID/status.
    std::shared_ptr<const std::string> status;
    /// Its root directory, as an `O_PATH` descriptor.
    std::shared_ptr<const FileDescriptor> root;
    std::optional<Confinement> confinement;
    /// It has been checked, after all this was read, that it is the token's process in the token's program.
    bool isConfirmed = false;
};

/// While one of these lives, the looks that the calling thread takes at a process share what was seen: a
/// message makes the daemon ask several questions about its sender, and the process that sent it is looked at
/// once for all of them. For one process, that of the first look. The transport makes one around the handling
/// of each message, up to its first suspension, so nothing is remembered from one message to the next.
class MessageLooks {
public:
    MessageLooks();
    ~MessageLooks();
    MessageLooks(const MessageLooks&) = delete;
    MessageLooks& operator=(const MessageLooks&) = delete;

    /// What the calling thread shares about that process, or null when it shares nothing.
    static SeenOfProcess* of(const AuditToken& token);

private:
    MessageLooks* const outer_;
    AuditToken token_;
    SeenOfProcess seen_;
};

}  // namespace typhon
