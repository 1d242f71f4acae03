#pragma once

#include "platform/linux/confinement.h"
#include "platform/linux/session_agents.h"
#include "platform/process_lifecycle.h"

namespace typhon {

/// Process visibility on Linux: a process is visible when it stands in the foreground of a terminal, or has a
/// window, that the session agent reports. Without an agent nobody is. Any thread.
class LinuxProcessLifecycle final : public ProcessLifecycle {
public:
    /// Both outlive this.
    LinuxProcessLifecycle(const SessionAgents& agents, const ConfinementProbe& probe)
        : agents_(agents), probe_(probe)
    {}

    std::optional<LWSProcessState> currentState(const LWSProcessIdentifier& identifier) override;

private:
    bool isVisible(const AuditToken& process) const;

    const SessionAgents& agents_;
    const ConfinementProbe& probe_;
};

}  // namespace typhon
