#include "platform/linux/linux_process_lifecycle.h"

#include "platform/linux/process_inspection.h"

namespace typhon {

std::optional<LWSProcessState> LinuxProcessLifecycle::currentState(const LWSProcessIdentifier& identifier)
{
    return isSameProcess(identifier.process) ? std::optional(LWSProcessState{}) : std::nullopt;
}

}  // namespace typhon
