#pragma once

#include "platform/task.h"
#include "platform/work_queue.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>

namespace typhon {

/// Counting semaphore. Waiters are served in the order in which they came. Any thread.
class Semaphore {
public:
    virtual ~Semaphore() = default;
    /// Suspends the running item until the count is above zero, then takes one.
    virtual Task<void> wait() = 0;
    /// Adds one and lets the longest waiter go on.
    virtual void signal() = 0;
};

/// One-shot timer whose handler runs on the queue it was created for. Any thread.
class Timer {
public:
    virtual ~Timer() = default;
    /// (Re-)arms the timer: the handler is posted once, at a moment in [delay, delay + leeway] from now on
    /// the boot clock, which goes on while the machine sleeps. A negative delay counts as zero.
    virtual void schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway) = 0;
    /// Disarms the timer. A handler that was already posted may still run.
    virtual void cancel() = 0;
};

enum class Priority { defaultPriority, background };

/// Queues, semaphores, timers and pauses, and the main dispatch loop. Outlives everything it created.
/// Any thread, but for `runMainLoop`.
class WorkQueues {
public:
    virtual ~WorkQueues() = default;

    virtual std::shared_ptr<WorkQueue> createSerialQueue(std::string label) = 0;
    /// The process-wide concurrent queue of that priority.
    virtual WorkQueue& concurrentQueue(Priority priority) = 0;
    /// The serial queue whose work runs on the main thread, inside `runMainLoop`.
    virtual WorkQueue& mainQueue() = 0;

    virtual std::shared_ptr<Semaphore> createSemaphore(unsigned initialCount) = 0;
    /// `queue` outlives the timer. Destroying the timer disarms it.
    virtual std::unique_ptr<Timer> createTimer(WorkQueue& queue, std::function<void()> handler) = 0;
    /// Suspends the running item for that long.
    virtual Task<void> pause(std::chrono::nanoseconds duration) = 0;

    /// Hands the main thread to the main queue. On Linux it never returns; the simulated one returns when
    /// nothing is left to run at the present virtual time.
    virtual void runMainLoop() = 0;
};

}  // namespace typhon
