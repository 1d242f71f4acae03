#pragma once

#include "platform/linux/event_pool.h"
#include "platform/linux/executor.h"
#include "platform/linux/linux_concurrent_queue.h"
#include "platform/linux/linux_serial_queue.h"
#include "platform/linux/main_loop.h"
#include "platform/linux/timer_service.h"
#include "platform/work_queues.h"

#include <memory>
#include <string>

namespace typhon {

/// Work queues over an event pool, which outlives them. A queue that nobody holds any more still finishes
/// the work it was given. Background work takes at most half of the pool's threads.
class LinuxWorkQueues final : public WorkQueues {
public:
    explicit LinuxWorkQueues(EventPool& pool);
    ~LinuxWorkQueues() override;

    std::shared_ptr<WorkQueue> createSerialQueue(std::string label) override;
    WorkQueue& concurrentQueue(Priority priority) override;
    WorkQueue& mainQueue() override;
    std::shared_ptr<Semaphore> createSemaphore(unsigned initialCount) override;
    std::unique_ptr<Timer> createTimer(WorkQueue& queue, std::function<void()> handler) override;
    Task<void> pause(std::chrono::nanoseconds duration) override;

    /// Returns only after `stopMainLoop`.
    void runMainLoop() override;
    /// Lets `runMainLoop` return after the work it is at. Any thread.
    void stopMainLoop();

    /// Drops all work, suspended work included, and takes no more. The pool should have been stopped
    /// before, and whatever the frames of suspended work refer to should still be there.
    void close();

private:
    class Registry;
    class ListedQueue;

    static Task<void> pauseWith(std::shared_ptr<TimerService> timers, std::chrono::nanoseconds duration);

    const std::shared_ptr<PoolExecutor> pool_;
    const std::shared_ptr<LimitedExecutor> backgroundPool_;
    const std::shared_ptr<MainLoop> mainLoop_ = std::make_shared<MainLoop>();
    const std::shared_ptr<TimerService> timers_;
    const std::shared_ptr<LinuxMainQueue> mainQueue_;
    const std::shared_ptr<LinuxConcurrentQueue> default_;
    const std::shared_ptr<LinuxConcurrentQueue> background_;
    const std::shared_ptr<Registry> registry_;
};

}  // namespace typhon
