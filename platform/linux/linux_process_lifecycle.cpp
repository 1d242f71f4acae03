#include "platform/linux/linux_process_lifecycle.h"

#include "platform/linux/process_inspection.h"
#include "platform/linux/terminal_foreground.h"

namespace typhon {

bool LinuxProcessLifecycle::isVisible(const AuditToken& process) const
{
    if (!agents_.isPresent()) {
        return false;
    }
    if (agents_.showsWindowOf(process)) {
        return true;
    }
    const auto terminal = foregroundTerminalOf(process, probe_);
    return terminal && agents_.showsTerminalTo(*terminal, process.effectiveUser);
}

std::optional<LWSProcessState> LinuxProcessLifecycle::currentState(const LWSProcessIdentifier& identifier)
{
    LWSProcessState state;
    if (isVisible(identifier.process)) {
        state.endowmentNamespaces.insert(visibilityEndowmentNamespace);
    }
    return isSameProcess(identifier.process) ? std::optional(std::move(state)) : std::nullopt;
}

}  // namespace typhon
