// What the queues on Linux do beyond the common contract: which thread runs what.

#include "platform/linux/linux_clock.h"
#include "platform/linux/linux_work_queues.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <ctime>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {

namespace {

using Queue = std::shared_ptr<WorkQueue>;

class LinuxWorkQueuesTest : public testing::Test {
protected:
    void happen()
    {
        const std::lock_guard lock(mutex_);
        ++count_;
        changed_.notify_all();
    }
    bool waitFor(int count)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, std::chrono::seconds(60), [&] { return count_ >= count; });
    }
    ~LinuxWorkQueuesTest() override { pool.stop(); }

    EventPool pool{EventPool::Options{.minimumThreads = 2, .maximumThreads = 4}};
    LinuxWorkQueues queues{pool};

private:
    std::mutex mutex_;
    std::condition_variable changed_;
    int count_ = 0;
};

Task<void> compareThreads(Queue other, bool* same, const WorkQueue** after)
{
    const auto here = std::this_thread::get_id();
    Task<std::thread::id> there = other->perform([] { return std::this_thread::get_id(); });
    *same = co_await std::move(there) == here;
    *same = *same && std::this_thread::get_id() == here;
    *after = &WorkItem::current()->queue;
}

TEST_F(LinuxWorkQueuesTest, awaitedWorkOnAnIdleQueueStaysOnTheCallersThread)
{
    const Queue caller = queues.createSerialQueue("caller");
    const Queue other = queues.createSerialQueue("other");
    bool same = false;
    const WorkQueue* after = nullptr;
    caller->async(compareThreads(other, &same, &after));
    caller->async([this] { happen(); });
    ASSERT_TRUE(waitFor(1));
    EXPECT_TRUE(same);
    EXPECT_EQ(after, caller.get());
}

TEST_F(LinuxWorkQueuesTest, messageIsHandledByTheThreadThatReadIt)
{
    const Queue queue = queues.createSerialQueue("connection");
    bool handled = false;
    pool.post([&] {
        const auto reader = std::this_thread::get_id();
        queue->asyncForConnection(std::make_shared<int>(), detail::callAsTask([&] {
                                      handled = std::this_thread::get_id() == reader;
                                  }));
        EXPECT_TRUE(handled) << "handled before the reader goes on";
        EXPECT_EQ(WorkItem::current(), nullptr);
        happen();
    });
    ASSERT_TRUE(waitFor(1));
}

TEST_F(LinuxWorkQueuesTest, messageIsNotHandledInsideOfOtherWork)
{
    const Queue queue = queues.createSerialQueue("connection");
    const Queue other = queues.createSerialQueue("other");
    const auto held = std::make_shared<std::mutex>();
    other->async([&] {
        const std::lock_guard lock(*held);
        queue->asyncForConnection(held, detail::callAsTask([this, held] {
                                      // Would wait for itself on the caller's thread.
                                      const std::lock_guard again(*held);
                                      happen();
                                  }));
    });
    EXPECT_TRUE(waitFor(1));
}

TEST_F(LinuxWorkQueuesTest, postedWorkRunsOnThePool)
{
    const Queue queue = queues.createSerialQueue("a");
    bool onPool = false;
    queue->async([&] {
        onPool = pool.isPoolThread();
        happen();
    });
    ASSERT_TRUE(waitFor(1));
    EXPECT_TRUE(onPool);
}

TEST_F(LinuxWorkQueuesTest, syncRunsOnTheCallersThread)
{
    const Queue queue = queues.createSerialQueue("a");
    queue->async([] {});
    std::thread::id there;
    queue->sync([&there] { there = std::this_thread::get_id(); });
    EXPECT_EQ(there, std::this_thread::get_id());
}

TEST_F(LinuxWorkQueuesTest, concurrentQueueUsesThePoolUpToItsCap)
{
    std::mutex mutex;
    std::condition_variable changed;
    unsigned running = 0;
    unsigned peak = 0;
    bool released = false;
    for (int i = 0; i < 20; ++i) {
        queues.concurrentQueue(Priority::defaultPriority).async([&] {
            std::unique_lock lock(mutex);
            peak = std::max(peak, ++running);
            changed.notify_all();
            changed.wait(lock, [&] { return released; });
            --running;
            lock.unlock();
            happen();
        });
    }
    {
        std::unique_lock lock(mutex);
        EXPECT_TRUE(changed.wait_for(lock, std::chrono::seconds(60), [&] { return running == 4; }));
        released = true;
        changed.notify_all();
    }
    ASSERT_TRUE(waitFor(20));
    EXPECT_EQ(peak, 4U);
    EXPECT_EQ(pool.threadCount(), 4U);
}

TEST_F(LinuxWorkQueuesTest, backgroundWorkLeavesHalfOfThePoolToTheRest)
{
    std::mutex mutex;
    std::condition_variable changed;
    unsigned running = 0;
    unsigned peak = 0;
    bool released = false;
    for (int i = 0; i < 20; ++i) {
        queues.concurrentQueue(Priority::background).async([&] {
            std::unique_lock lock(mutex);
            peak = std::max(peak, ++running);
            changed.notify_all();
            changed.wait(lock, [&] { return released; });
            --running;
            lock.unlock();
            happen();
        });
    }
    {
        std::unique_lock lock(mutex);
        EXPECT_TRUE(changed.wait_for(lock, std::chrono::seconds(60), [&] { return running == 2; }));
    }
    // With background work stuck, other work of any kind still gets done.
    queues.createSerialQueue("a")->async([this] { happen(); });
    queues.concurrentQueue(Priority::defaultPriority).async([this] { happen(); });
    ASSERT_TRUE(waitFor(2));
    {
        const std::lock_guard lock(mutex);
        released = true;
        changed.notify_all();
    }
    ASSERT_TRUE(waitFor(22));
    EXPECT_EQ(peak, 2U);
}

Task<void> performMany(Queue other, int times, int* counter)
{
    for (int i = 0; i < times; ++i) {
        Task<void> step = other->perform([counter] { ++*counter; });
        co_await std::move(step);
    }
}

TEST_F(LinuxWorkQueuesTest, contendedQueueServesEverybodyOneAtATime)
{
    constexpr int callers = 8;
    constexpr int times = 500;
    const Queue shared = queues.createSerialQueue("shared");
    int counter = 0;
    std::vector<Queue> held;
    for (int i = 0; i < callers; ++i) {
        held.push_back(queues.createSerialQueue("caller"));
        held.back()->async(performMany(shared, times, &counter));
        held.back()->async([&] {
            shared->sync([&counter] { ++counter; });
            happen();
        });
    }
    for (int i = 0; i < times; ++i) {
        shared->sync([&counter] { ++counter; });
        shared->async([&counter] { ++counter; });
    }
    ASSERT_TRUE(waitFor(callers));
    shared->sync([] {});
    EXPECT_EQ(counter, callers * (times + 1) + 2 * times);
}

TEST(LinuxClock, readsTheClocksOfTheKernel)
{
    const LinuxClock clock;
    const auto before = clock.uptime();
    timespec boot{};
    clock_gettime(CLOCK_BOOTTIME, &boot);
    const auto after = clock.uptime();
    const auto kernel = std::chrono::seconds(boot.tv_sec) + std::chrono::nanoseconds(boot.tv_nsec);
    EXPECT_LE(before, kernel);
    EXPECT_LE(kernel, after);
    const auto earlier = static_cast<double>(std::time(nullptr));
    const double now = clock.now();
    EXPECT_GE(now, earlier - 1);
    EXPECT_LE(now, static_cast<double>(std::time(nullptr)) + 1);
}

}  // namespace

}  // namespace typhon
