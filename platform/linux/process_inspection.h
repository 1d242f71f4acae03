#pragma once

#include "platform/audit_token.h"
#include "platform/linux/held_process.h"
#include "platform/linux/message_looks.h"
#include "platform/log.h"

#include <memory>
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

    /// An `O_PATH` descriptor of the process's directory in /proc. Owned by this. Whoever asks for it reads
    /// something new, which is to be confirmed.
    int directory() const;
    /// The same, and owned by this too.
    int pidfd() const;

    /// True when the process still runs the program of the token, and did so since `begin`. A look that found
    /// all it needed in what an earlier one of the same message has read is as good as that one: nothing is
    /// asked again.
    bool isStillTheSame() const;

    /// A file of the process's directory, at most `limit` bytes of it; null when it cannot be read.
    std::optional<std::string> contents(const char* name, std::size_t limit) const;
    /// Its /proc/PID/status, as far as it is of reasonable length; null when it cannot be read. Read once for
    /// all looks of the same message.
    std::shared_ptr<const std::string> status() const;
    /// An `O_PATH` descriptor of its root directory; none if that cannot be opened. Opened once for all looks
    /// of the same message.
    std::shared_ptr<const FileDescriptor> root() const;

    /// Where looks remember what they have seen, for the others of the same message.
    SeenOfProcess& seen() const;

private:
    ProcessInspection(const AuditToken& token, std::shared_ptr<const HeldProcess> process);
    const HeldProcess& readNow() const;

    AuditToken token_;
    std::shared_ptr<const HeldProcess> process_;
    /// For a look that shares with nobody.
    mutable SeenOfProcess seen_;
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

/// True when the token names a process that still runs the same program, or did at an earlier look of the
/// same message.
bool isSameProcess(const AuditToken& token);

/// Says once in the log by what processes are told apart on this kernel.
void logProcessIdentity(Log& log);

}  // namespace typhon
