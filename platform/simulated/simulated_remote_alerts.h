#pragma once

#include "platform/remote_alert.h"
#include "platform/simulated/simulated_ipc.h"

#include <cstddef>
#include <memory>
#include <vector>

namespace typhon {

/// One alert that was asked for.
struct SimulatedRemoteAlert {
    HWSRemoteAlertDefinition definition;
    /// Null when the configuration carried none.
    std::shared_ptr<ListenerEndpoint> endpoint;
    /// The user info of each activation, in order.
    std::vector<PropertyList> activations;
};

/// The remote-alert service: remembers every alert, and lets a test act as the service that shows it. The
/// definition class is available until the test says otherwise. One thread.
class SimulatedRemoteAlerts final : public RemoteAlerts {
public:
    /// `ipc` outlives this.
    explicit SimulatedRemoteAlerts(SimulatedIpc& ipc) : ipc_(ipc) {}

    bool isDefinitionClassAvailable() override { return isAvailable_; }
    std::shared_ptr<HWSRemoteAlertHandle>
    newHandle(HWSRemoteAlertDefinition withDefinition,
              HWSRemoteAlertConfigurationContext configurationContext) override;

    void setDefinitionClassAvailable(bool isAvailable) { isAvailable_ = isAvailable; }

    /// Every alert, in the order in which their handles were made.
    const std::vector<std::shared_ptr<const SimulatedRemoteAlert>>& alerts() const { return alerts_; }

    /// A resumed connection of the view service to the endpoint of an alert, as often as it likes.
    /// `viewService`: the token of its process, of the daemon's own user. `calls`: what it may call.
    std::shared_ptr<Connection> connectViewService(std::size_t alert, const AuditToken& viewService,
                                                   InterfaceDescriptions calls);

private:
    SimulatedIpc& ipc_;
    bool isAvailable_ = true;
    std::vector<std::shared_ptr<const SimulatedRemoteAlert>> alerts_;
};

}  // namespace typhon
