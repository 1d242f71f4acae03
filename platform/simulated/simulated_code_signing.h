#pragma once

#include "platform/code_signing.h"
#include "platform/simulated/simulated_processes.h"

namespace typhon {

/// Code signatures as the simulated processes have them. Any thread.
class SimulatedCodeSigning : public CodeSigning {
public:
    /// `processes` outlives this.
    explicit SimulatedCodeSigning(const SimulatedProcesses& processes) : processes_(processes) {}

    std::optional<CodeSigningTask> taskFromAuditToken(const AuditToken& token) override;

private:
    const SimulatedProcesses& processes_;
};

}  // namespace typhon
