#include "platform/linux/linux_remote_alerts.h"

#include <utility>

namespace typhon {

namespace {

class LinuxRemoteAlertHandle final : public HWSRemoteAlertHandle {
public:
    LinuxRemoteAlertHandle(Log& log, HWSRemoteAlertDefinition definition)
        : log_(log), definition_(std::move(definition))
    {}

    void activateWithContext(HWSRemoteAlertActivationContext /*context*/) override
    {
        TYLog_Error(log_, "an alert of " + definition_.serviceName + " cannot appear: there is no agent");
    }

private:
    Log& log_;
    const HWSRemoteAlertDefinition definition_;
};

}  // namespace

std::shared_ptr<HWSRemoteAlertHandle>
LinuxRemoteAlerts::newHandle(HWSRemoteAlertDefinition withDefinition,
                             HWSRemoteAlertConfigurationContext /*configurationContext*/)
{
    return std::make_shared<LinuxRemoteAlertHandle>(log_, std::move(withDefinition));
}

}  // namespace typhon
