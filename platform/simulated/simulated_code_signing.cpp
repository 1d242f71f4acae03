#include "platform/simulated/simulated_code_signing.h"

namespace typhon {

std::optional<CodeSigningTask> SimulatedCodeSigning::taskFromAuditToken(const AuditToken& token)
{
    auto process = processes_.find(token);
    if (!process) {
        return std::nullopt;
    }
    return CodeSigningTask{std::move(process->signingIdentifier), std::move(process->entitlements)};
}

}  // namespace typhon
