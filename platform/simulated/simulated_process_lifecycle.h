#pragma once

#include "platform/process_lifecycle.h"
#include "platform/simulated/simulated_processes.h"

#include <cstdint>
#include <mutex>
#include <optional>
#include <set>

namespace typhon {

/// The process-lifecycle service over the simulated processes: those that run have a state, and the test says
/// which of them the user can see. None at first. Any thread.
class SimulatedProcessLifecycle final : public ProcessLifecycle {
public:
    /// `processes` outlives this.
    explicit SimulatedProcessLifecycle(const SimulatedProcesses& processes) : processes_(processes) {}

    std::optional<LWSProcessState> currentState(const LWSProcessIdentifier& identifier) override;

    /// Says whether the user can see the process, whatever programs it goes on to run.
    void setVisible(const AuditToken& process, bool isVisible);

private:
    const SimulatedProcesses& processes_;
    mutable std::mutex mutex_;
    /// By process instance.
    std::set<std::uint64_t> visible_;
};

}  // namespace typhon
