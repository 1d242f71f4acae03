#pragma once

#include "platform/audit_token.h"
#include "platform/linux/file_descriptor.h"
#include "platform/log.h"

#include <optional>
#include <string>

namespace typhon {

/// A look at the process that an audit token names. Begin it, read through `directory()`, and believe what
/// was read only if `isStillTheSame()` says so afterwards: in between the process may have exited, its
/// process identifier may have gone to another one, and it may have become another program.
class ProcessInspection {
public:
    /// Null when there is no such process (any more).
    static std::optional<ProcessInspection> begin(const AuditToken& token);

    /// An `O_PATH` descriptor of the process's directory in /proc. Owned by this.
    int directory() const { return directory_.get(); }
    /// Owned by this.
    int pidfd() const { return pidfd_.get(); }

    /// True when the process still runs the program of the token, and did so since `begin`.
    bool isStillTheSame() const;

    /// A file of the process's directory, at most `limit` bytes of it; null when it cannot be read.
    std::optional<std::string> contents(const char* name, std::size_t limit = 64 * 1024) const;

private:
    ProcessInspection(const AuditToken& token, FileDescriptor pidfd, FileDescriptor directory);

    AuditToken token_;
    FileDescriptor pidfd_;
    FileDescriptor directory_;
};

/// Begins an inspection, looks, and gives what `look` returned (an optional) if the process still is the
/// same; else null.
template <class Look>
auto inspectProcess(const AuditToken& token, Look look) -> decltype(look(*ProcessInspection::begin(token)))
{
    const auto process = ProcessInspection::begin(token);
    if (!process) {
        return std::nullopt;
    }
    auto seen = look(*process);
    if (!process->isStillTheSame()) {
        return std::nullopt;
    }
    return seen;
}

/// True when the token names a process that still runs the same program.
bool isSameProcess(const AuditToken& token);

/// Says once in the log by what processes are told apart on this kernel.
void logProcessIdentity(Log& log);

}  // namespace typhon
