#pragma once

#include "platform/linux/session_agents.h"
#include "platform/remote_alert.h"

namespace typhon {

/// Remote alerts on Linux: the session agent shows them. Without one the definition class is not available.
/// Any thread.
class LinuxRemoteAlerts final : public RemoteAlerts {
public:
    /// `agents` outlives this and every handle.
    explicit LinuxRemoteAlerts(SessionAgents& agents) : agents_(agents) {}

    bool isDefinitionClassAvailable() override { return agents_.isPresent(); }
    std::shared_ptr<HWSRemoteAlertHandle>
    newHandle(HWSRemoteAlertDefinition withDefinition,
              HWSRemoteAlertConfigurationContext configurationContext) override;

private:
    SessionAgents& agents_;
};

}  // namespace typhon
