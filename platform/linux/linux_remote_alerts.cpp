#include "platform/linux/linux_remote_alerts.h"

#include <utility>

namespace typhon {

namespace {

class LinuxRemoteAlertHandle final : public HWSRemoteAlertHandle {
public:
    LinuxRemoteAlertHandle(SessionAgents& agents, HWSRemoteAlertDefinition definition,
                           std::shared_ptr<ListenerEndpoint> endpoint)
        : agents_(agents), definition_(std::move(definition)), endpoint_(std::move(endpoint))
    {}

    void activateWithContext(HWSRemoteAlertActivationContext context) override
    {
        agents_.show({definition_.serviceName, definition_.viewControllerClassName,
                      std::move(context.userInfo), endpoint_});
    }

private:
    SessionAgents& agents_;
    const HWSRemoteAlertDefinition definition_;
    const std::shared_ptr<ListenerEndpoint> endpoint_;
};

}  // namespace

std::shared_ptr<HWSRemoteAlertHandle>
LinuxRemoteAlerts::newHandle(HWSRemoteAlertDefinition withDefinition,
                             HWSRemoteAlertConfigurationContext configurationContext)
{
    return std::make_shared<LinuxRemoteAlertHandle>(agents_, std::move(withDefinition),
                                                    std::move(configurationContext.endpoint));
}

}  // namespace typhon
