#pragma once

#include "platform/ipc.h"
#include "platform/property_list.h"

#include <memory>
#include <string>

namespace typhon {

/// `HWSRemoteAlertDefinition`. Which view of which service an alert shows.
struct HWSRemoteAlertDefinition {
    std::string serviceName;
    std::string viewControllerClassName;
};

/// What the service needs to set an alert up: the endpoint through which it answers.
struct HWSRemoteAlertConfigurationContext {
    std::shared_ptr<ListenerEndpoint> endpoint;
};

/// What an alert shows.
struct HWSRemoteAlertActivationContext {
    PropertyList userInfo;
};

/// `HWSRemoteAlertHandle`. One alert. Letting go of it leaves the alert up. Any thread.
class HWSRemoteAlertHandle {
public:
    virtual ~HWSRemoteAlertHandle() = default;
    /// `activateWithContext:`. Shows the alert. Returns at once; an alert that fails to appear is logged.
    virtual void activateWithContext(HWSRemoteAlertActivationContext context) = 0;
};

/// The remote-alert service. Any thread.
class RemoteAlerts {
public:
    virtual ~RemoteAlerts() = default;
    /// Whether the class `HWSRemoteAlertDefinition` is available: whether anybody could show an alert now.
    virtual bool isDefinitionClassAvailable() = 0;
    /// `newHandleWithDefinition:configurationContext:`. Never null.
    virtual std::shared_ptr<HWSRemoteAlertHandle>
    newHandle(HWSRemoteAlertDefinition withDefinition,
              HWSRemoteAlertConfigurationContext configurationContext) = 0;
};

}  // namespace typhon
