#include "platform/simulated/simulated_process_lifecycle.h"

namespace typhon {

std::optional<LWSProcessState> SimulatedProcessLifecycle::currentState(const LWSProcessIdentifier& identifier)
{
    if (!processes_.find(identifier.process)) {
        return std::nullopt;
    }
    const std::lock_guard lock(mutex_);
    LWSProcessState state;
    if (visible_.contains(identifier.process.processInstance)) {
        state.endowmentNamespaces.insert(visibilityEndowmentNamespace);
    }
    return state;
}

void SimulatedProcessLifecycle::setVisible(const AuditToken& process, bool isVisible)
{
    const std::lock_guard lock(mutex_);
    if (isVisible) {
        visible_.insert(process.processInstance);
    } else {
        visible_.erase(process.processInstance);
    }
}

}  // namespace typhon
