#include "platform/linux/linux_code_signing.h"

namespace typhon {

CodeSigningTask LinuxCodeSigning::taskOf(const ProcessInspection& process)
{
    // The executable first: a process can put another one there only in a user namespace of its own, which it
    // cannot leave again. So the one seen before a look from outside any sandbox is the real one.
    const auto executable = signatures_.executableOf(process.directory());
    if (probe_.look(process).isSandboxed) {
        return instances_.taskOf(process).value_or(CodeSigningTask{});
    }
    const auto digest = signatures_.digestOf(executable);
    return digest ? signatures_.taskOfExecutable(*digest) : CodeSigningTask{};
}

std::optional<CodeSigningTask> LinuxCodeSigning::taskFromAuditToken(const AuditToken& token)
{
    return inspectProcess(
        token, [this](const ProcessInspection& process) { return std::optional(taskOf(process)); });
}

}  // namespace typhon
