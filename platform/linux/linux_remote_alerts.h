#pragma once

#include "platform/log.h"
#include "platform/remote_alert.h"

namespace typhon {

/// Remote alerts on Linux. Without a session agent the definition class is not available, and an alert fails
/// to appear. Any thread.
class LinuxRemoteAlerts final : public RemoteAlerts {
public:
    /// `log` outlives this and every handle.
    explicit LinuxRemoteAlerts(Log& log) : log_(log) {}

    bool isDefinitionClassAvailable() override { return false; }
    std::shared_ptr<HWSRemoteAlertHandle>
    newHandle(HWSRemoteAlertDefinition withDefinition,
              HWSRemoteAlertConfigurationContext configurationContext) override;

private:
    Log& log_;
};

}  // namespace typhon
