#include "platform/simulated/simulated_remote_alerts.h"

#include <utility>

namespace typhon {

namespace {

class SimulatedRemoteAlertHandle final : public HWSRemoteAlertHandle {
public:
    explicit SimulatedRemoteAlertHandle(std::shared_ptr<SimulatedRemoteAlert> alert)
        : alert_(std::move(alert))
    {}

    void activateWithContext(HWSRemoteAlertActivationContext context) override
    {
        alert_->activations.push_back(std::move(context.userInfo));
    }

private:
    const std::shared_ptr<SimulatedRemoteAlert> alert_;
};

}  // namespace

std::shared_ptr<HWSRemoteAlertHandle>
SimulatedRemoteAlerts::newHandle(HWSRemoteAlertDefinition withDefinition,
                                 HWSRemoteAlertConfigurationContext configurationContext)
{
    auto alert = std::make_shared<SimulatedRemoteAlert>();
    alert->definition = std::move(withDefinition);
    alert->endpoint = std::move(configurationContext.endpoint);
    alerts_.push_back(alert);
    return std::make_shared<SimulatedRemoteAlertHandle>(std::move(alert));
}

std::shared_ptr<Connection> SimulatedRemoteAlerts::connectViewService(std::size_t alert,
                                                                      const AuditToken& viewService,
                                                                      InterfaceDescriptions calls)
{
    auto connection = ipc_.process(viewService)->connectionToEndpoint(alerts_.at(alert)->endpoint);
    connection->setRemoteObjectInterfaces(std::move(calls));
    connection->resume();
    return connection;
}

}  // namespace typhon
