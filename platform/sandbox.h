#pragma once

#include "platform/audit_token.h"

#include <optional>
#include <string>

namespace typhon {

/// What a process may do by itself, and grants to do more. Any thread; may block on the file system.
/// When a question cannot be answered, the answer is the one that gives least away.
class Sandbox {
public:
    virtual ~Sandbox() = default;
    /// True when the process is confined in any way, and when that cannot be told.
    virtual bool isSandboxed(const AuditToken& token) = 0;
    /// "file-read-data": true when the process can by itself read the very file (or directory) that the
    /// daemon sees at the logical path.
    virtual bool mayRead(const AuditToken& token, const std::string& path) = 0;
    /// A read extension for a file, or for all files beneath a directory, that only this process can use.
    /// Null when the process is gone or nothing can be granted.
    virtual std::optional<std::string> issueReadExtension(const AuditToken& token,
                                                          const std::string& path) = 0;
};

}  // namespace typhon
