#pragma once

#include "platform/linux/event_pool.h"
#include "platform/linux/linux_clock.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/simulated/simulated_clock.h"
#include "platform/simulated/simulated_scheduler.h"
#include "platform/simulated/simulated_work_queues.h"

#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>

#include <gtest/gtest.h>

namespace typhon::test {

/// Counts what has happened, for a test that waits for it.
class Events {
public:
    void happen()
    {
        const std::lock_guard lock(mutex_);
        ++count_;
        changed_.notify_all();
    }
    unsigned count() const
    {
        const std::lock_guard lock(mutex_);
        return count_;
    }
    /// Blocks until `count` of them have happened; false if they have not after a long time.
    bool waitFor(unsigned count)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, std::chrono::seconds(60), [&] { return count_ >= count; });
    }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    unsigned count_ = 0;
};

/// The queues on Linux, with a small pool, and a thread that plays the main thread.
class LinuxHarness {
public:
    static constexpr unsigned maximumThreads = 4;

    ~LinuxHarness() { shutDown(); }

    WorkQueues& queues() { return queues_; }
    Clock& clock() { return clock_; }
    bool waitFor(Events& events, unsigned count) { return events.waitFor(count); }
    void startMainLoop()
    {
        mainThread_ = std::thread([this] { queues_.runMainLoop(); });
    }
    std::thread::id mainThread() const { return mainThread_.get_id(); }
    /// Starts `task` on the idle `queue` and returns when it has run to its first suspension.
    void startAndSettle(const std::shared_ptr<WorkQueue>& queue, Task<void> task)
    {
        // What the reader of a message does: its thread runs the handler itself.
        const auto body = std::make_shared<Task<void>>(std::move(task));
        Events settled;
        pool_.post([&] {
            queue->asyncForConnection(body, std::move(*body));
            settled.happen();
        });
        ASSERT_TRUE(settled.waitFor(1));
    }
    /// Ends in order, dropping all work that is left.
    void shutDown()
    {
        if (mainThread_.joinable()) {
            queues_.stopMainLoop();
            mainThread_.join();
        }
        pool_.stop();
        queues_.close();
    }

private:
    EventPool pool_{EventPool::Options{.minimumThreads = 2, .maximumThreads = maximumThreads}};
    LinuxWorkQueues queues_{pool_};
    LinuxClock clock_;
    std::thread mainThread_;
};

/// The simulated queues, under one seed.
template <std::uint64_t seed>
class SimulatedHarness {
public:
    WorkQueues& queues() { return queues_; }
    Clock& clock() { return clock_; }
    bool waitFor(Events& events, unsigned count)
    {
        return scheduler_.runUntil([&] { return events.count() >= count; });
    }
    void startMainLoop() { queues_.runMainLoop(); }
    void startAndSettle(const std::shared_ptr<WorkQueue>& queue, Task<void> task)
    {
        queue->async(std::move(task));
        scheduler_.runUntilIdle();
    }
    std::thread::id mainThread() const { return std::this_thread::get_id(); }
    void shutDown() { queues_.close(); }

private:
    SimulatedScheduler scheduler_{seed};
    SimulatedWorkQueues queues_{scheduler_};
    SimulatedClock clock_{scheduler_};
};

using Queue = std::shared_ptr<WorkQueue>;

template <class Harness>
class WorkQueuesTest : public testing::Test {
protected:
    WorkQueues& queues() { return harness.queues(); }
    Queue serialQueue(const std::string& label) { return harness.queues().createSerialQueue(label); }
    bool waitFor(Events& events, unsigned count = 1) { return harness.waitFor(events, count); }

    /// Runs `task` on `queue`, to its end.
    void run(const Queue& queue, Task<void> task)
    {
        Events ended;
        queue->async(std::move(task));
        queue->async([&ended] { ended.happen(); });
        ASSERT_TRUE(waitFor(ended)) << "the task did not end";
    }

    /// Runs `task` on a queue of its own, to its end.
    void run(Task<void> task) { run(serialQueue("com.vorlan.test"), std::move(task)); }

    Harness harness;
};

using Harnesses = testing::Types<LinuxHarness, SimulatedHarness<1>, SimulatedHarness<2>, SimulatedHarness<3>,
                                 SimulatedHarness<4>, SimulatedHarness<5>>;
inline Task<void> waitThen(std::shared_ptr<Semaphore> semaphore, std::function<void()> then)
{
    Task<void> turn = semaphore->wait();
    co_await std::move(turn);
    then();
}

}  // namespace typhon::test
