#pragma once

#include "platform/simulated/simulated_queue.h"
#include "platform/simulated/simulated_scheduler.h"
#include "platform/work_queues.h"

#include <cstddef>
#include <memory>
#include <string>
#include <unordered_map>

namespace typhon {

/// Work queues on a simulated scheduler, which outlives them.
class SimulatedWorkQueues final : public WorkQueues {
public:
    explicit SimulatedWorkQueues(SimulatedScheduler& scheduler);
    ~SimulatedWorkQueues() override;

    std::shared_ptr<WorkQueue> createSerialQueue(std::string label) override;
    WorkQueue& concurrentQueue(Priority priority) override;
    WorkQueue& mainQueue() override { return *main_; }
    std::shared_ptr<Semaphore> createSemaphore(unsigned initialCount) override;
    /// A timer with leeway fires at a moment in its window that the seed decides.
    std::unique_ptr<Timer> createTimer(WorkQueue& queue, std::function<void()> handler) override;
    Task<void> pause(std::chrono::nanoseconds duration) override;
    /// Returns when nothing is left to run at the present virtual time.
    void runMainLoop() override { scheduler_.runUntilIdle(); }

    /// Drops all work, suspended work included, and takes no more. For tests whose suspended work refers
    /// to objects that go before the queues do.
    void close();
    /// Items of all queues that wait, run or are suspended.
    std::size_t itemCount() const;

private:
    std::shared_ptr<SimulatedQueue> createQueue(std::string label, bool serial);

    struct Registry;
    SimulatedScheduler& scheduler_;
    const std::shared_ptr<Registry> registry_;
    const std::shared_ptr<SimulatedQueue> main_;
    const std::shared_ptr<SimulatedQueue> default_;
    const std::shared_ptr<SimulatedQueue> background_;
};

}  // namespace typhon
