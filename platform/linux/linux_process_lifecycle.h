#pragma once

#include "platform/process_lifecycle.h"

namespace typhon {

/// Process visibility on Linux. Without a session agent that reports what the user sees, nobody is visible.
/// Any thread.
class LinuxProcessLifecycle final : public ProcessLifecycle {
public:
    std::optional<LWSProcessState> currentState(const LWSProcessIdentifier& identifier) override;
};

}  // namespace typhon
