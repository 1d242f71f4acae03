#include "platform/simulated/simulated_code_signing.h"

namespace typhon {

std::optional<CodeSigningTask> SimulatedCodeSigning::taskFromAuditToken(const AuditToken& token)
{
    auto process = processes_.find(token);
    if (!process) {
        return std::nullopt;
    }
    CodeSigningTask task{std::move(process->signingIdentifier), {}};
    if (task.signingIdentifier) {
        task.entitlements = std::move(process->entitlements);
    }
    return task;
}

}  // namespace typhon
