#pragma once

#include "platform/code_signing.h"
#include "platform/linux/confinement.h"
#include "platform/linux/sandbox_instances.h"
#include "platform/linux/signature_store.h"

namespace typhon {

/// Code signing on Linux: the identity of a process in a sandbox is that of its registered sandbox, the one
/// of a process outside is that of the executable it runs. Any thread.
class LinuxCodeSigning : public CodeSigning {
public:
    /// All of them outlive this.
    LinuxCodeSigning(const ConfinementProbe& probe, const SandboxInstances& instances,
                     SignatureStore& signatures)
        : probe_(probe), instances_(instances), signatures_(signatures)
    {}

    std::optional<CodeSigningTask> taskFromAuditToken(const AuditToken& token) override;

private:
    CodeSigningTask taskOf(const ProcessInspection& process);

    const ConfinementProbe& probe_;
    const SandboxInstances& instances_;
    SignatureStore& signatures_;
};

}  // namespace typhon
