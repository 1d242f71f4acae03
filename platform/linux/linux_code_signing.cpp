#include "platform/linux/linux_code_signing.h"

#include <fcntl.h>

namespace typhon {

CodeSigningTask LinuxCodeSigning::taskOf(const ProcessInspection& process)
{
    // The executable first: a process can put another one there only in a user namespace of its own, which it
    // cannot leave again. So the one seen before a look from outside any sandbox is the real one.
    const FileDescriptor executable(
        ::openat(process.directory(), "exe", O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    if (probe_.look(process).isSandboxed) {
        return instances_.taskOf(process).value_or(CodeSigningTask{});
    }
    const auto digest = executable ? signatures_.digestOfExecutable(executable.get()) : std::nullopt;
    return digest ? signatures_.taskOfExecutable(*digest) : CodeSigningTask{};
}

std::optional<CodeSigningTask> LinuxCodeSigning::taskFromAuditToken(const AuditToken& token)
{
    return inspectProcess(
        token, [this](const ProcessInspection& process) { return std::optional(taskOf(process)); });
}

}  // namespace typhon
