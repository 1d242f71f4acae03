#pragma once

#include "platform/audit_token.h"
#include "platform/linux/file_descriptor.h"

#include <cstddef>
#include <memory>

namespace typhon {

/// What is held open of a process: it names the process, whatever becomes of its number and whatever program
/// it runs. It says nothing about the program: that is for a `ProcessInspection` to check, at every look.
/// `const` means safe to share.
struct HeldProcess {
    FileDescriptor pidfd;
    /// An `O_PATH` descriptor of the process's directory in /proc.
    FileDescriptor directory;
    /// Its file "status" there, open for reading at any offset; none if it cannot be opened.
    FileDescriptor status;
};

/// The process of a token that was held before, or opened now; null when there is no such process. One that
/// was opened now is surely the token's only once `processOfPidfd` still tells its number.
std::shared_ptr<const HeldProcess> holdProcess(const AuditToken& token);

/// Keeps the process, which is one that sends messages, for later looks, unless it is kept. It has been seen
/// to be that of the token.
void keepProcess(const AuditToken& token, const std::shared_ptr<const HeldProcess>& process);

/// Keeps it no longer: a connection of the process has ended, and so, most likely, has the process.
void releaseProcess(const AuditToken& token);

/// So many are kept, those that were looked at last.
inline constexpr std::size_t maximumHeldProcesses = 64;

}  // namespace typhon
