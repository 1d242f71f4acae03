// Semaphores, timers, pauses and the main queue: what every implementation promises.

#include "work_queues_harness.h"

#include <chrono>
#include <functional>
#include <memory>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon::test {

namespace {

using namespace std::chrono_literals;
using std::chrono::nanoseconds;
using testing::ElementsAre;

TYPED_TEST_SUITE(WorkQueuesTest, Harnesses);

TYPED_TEST(WorkQueuesTest, semaphoreLetsAsManyThroughAsItCounts)
{
    const auto semaphore = this->queues().createSemaphore(2);
    Events through;
    std::vector<Queue> waiting;
    for (int i = 0; i < 5; ++i) {
        waiting.push_back(this->serialQueue("waiter"));
        this->harness.startAndSettle(waiting.back(), waitThen(semaphore, [&through] { through.happen(); }));
    }
    EXPECT_EQ(through.count(), 2U);
    semaphore->signal();
    ASSERT_TRUE(this->waitFor(through, 3));
    EXPECT_EQ(through.count(), 3U);
    semaphore->signal();
    semaphore->signal();
    ASSERT_TRUE(this->waitFor(through, 5));
}

TYPED_TEST(WorkQueuesTest, semaphoreServesWaitersInTheOrderInWhichTheyCame)
{
    const auto semaphore = this->queues().createSemaphore(0);
    std::vector<int> order;
    Events through;
    std::vector<Queue> waiting;
    for (int i = 0; i < 5; ++i) {
        waiting.push_back(this->serialQueue("waiter"));
        this->harness.startAndSettle(waiting.back(), waitThen(semaphore, [&order, &through, i] {
                                         order.push_back(i);
                                         through.happen();
                                     }));
    }
    for (unsigned served = 1; served <= 5; ++served) {
        semaphore->signal();
        ASSERT_TRUE(this->waitFor(through, served));
    }
    EXPECT_THAT(order, ElementsAre(0, 1, 2, 3, 4));
}

Task<void> waitTwice(std::shared_ptr<Semaphore> semaphore, Events* through)
{
    for (int i = 0; i < 2; ++i) {
        Task<void> turn = semaphore->wait();
        co_await std::move(turn);
        through->happen();
    }
}

TYPED_TEST(WorkQueuesTest, signalsBeforeTheWaitAreKept)
{
    const auto semaphore = this->queues().createSemaphore(0);
    semaphore->signal();
    semaphore->signal();
    Events through;
    this->run(waitTwice(semaphore, &through));
    EXPECT_EQ(through.count(), 2U);
}

Task<void> waitThenDrop(std::shared_ptr<std::shared_ptr<Semaphore>> semaphore)
{
    Task<void> turn = (*semaphore)->wait();
    co_await std::move(turn);
    semaphore->reset();
}

TYPED_TEST(WorkQueuesTest, waiterMayDestroyTheSemaphore)
{
    const auto semaphore = std::make_shared<std::shared_ptr<Semaphore>>(this->queues().createSemaphore(0));
    const Queue queue = this->serialQueue("waiter");
    Events ended;
    this->harness.startAndSettle(queue, waitThenDrop(semaphore));
    queue->async([&ended] { ended.happen(); });
    Semaphore& signalled = **semaphore;
    signalled.signal();
    ASSERT_TRUE(this->waitFor(ended));
    EXPECT_EQ(*semaphore, nullptr);
}

// Timers

/// Does `attempt` anew until it says that it was not held up for so long that it proves nothing.
void repeatUntilUndisturbed(const std::function<bool()>& attempt)
{
    constexpr int most = 1000;
    for (int times = 0; times < most; ++times) {
        if (attempt()) {
            return;
        }
    }
    FAIL() << "the test was always held up";
}

TYPED_TEST(WorkQueuesTest, timerRunsItsHandlerOnItsQueueNotBeforeItsDelay)
{
    const Queue queue = this->serialQueue("timer");
    Events fired;
    nanoseconds at{};
    const WorkQueue* on = nullptr;
    const auto timer = this->queues().createTimer(*queue, [&] {
        at = this->harness.clock().uptime();
        on = &WorkItem::current()->queue;
        fired.happen();
    });
    const nanoseconds start = this->harness.clock().uptime();
    timer->schedule(20ms, 10ms);
    ASSERT_TRUE(this->waitFor(fired));
    EXPECT_GE(at - start, 20ms);
    EXPECT_EQ(on, queue.get());
}

TYPED_TEST(WorkQueuesTest, timerFiresOnceForEachSchedule)
{
    const Queue queue = this->serialQueue("timer");
    Events fired;
    Events later;
    const auto timer = this->queues().createTimer(*queue, [&fired] { fired.happen(); });
    const auto laterTimer = this->queues().createTimer(*queue, [&later] { later.happen(); });
    for (unsigned round = 1; round <= 2; ++round) {
        timer->schedule(1ms, 0ms);
        ASSERT_TRUE(this->waitFor(fired, round));
        laterTimer->schedule(20ms, 0ms);
        ASSERT_TRUE(this->waitFor(later, round));
        EXPECT_EQ(fired.count(), round);
    }
}

TYPED_TEST(WorkQueuesTest, rearmedTimerForgetsItsEarlierTime)
{
    repeatUntilUndisturbed([this] {
        const Queue queue = this->serialQueue("timer");
        Events fired;
        Events later;
        auto timer = this->queues().createTimer(*queue, [&fired] { fired.happen(); });
        const auto laterTimer = this->queues().createTimer(*queue, [&later] { later.happen(); });
        const nanoseconds start = this->harness.clock().uptime();
        timer->schedule(20ms, 0ms);
        timer->schedule(1h, 0ms);
        const bool undisturbed = this->harness.clock().uptime() - start < 20ms;
        laterTimer->schedule(30ms, 0ms);
        EXPECT_TRUE(this->waitFor(later));
        EXPECT_TRUE(!undisturbed || fired.count() == 0U);
        const auto before = fired.count();
        timer->schedule(0ms, 0ms);
        EXPECT_TRUE(this->waitFor(fired, before + 1));
        timer.reset();
        queue->sync([] {});
        return undisturbed;
    });
}

TYPED_TEST(WorkQueuesTest, cancelledAndDestroyedTimersDoNotFire)
{
    repeatUntilUndisturbed([this] {
        const Queue queue = this->serialQueue("timer");
        Events fired;
        Events later;
        auto timer = this->queues().createTimer(*queue, [&fired] { fired.happen(); });
        auto destroyed = this->queues().createTimer(*queue, [&fired] { fired.happen(); });
        const auto laterTimer = this->queues().createTimer(*queue, [&later] { later.happen(); });
        const nanoseconds start = this->harness.clock().uptime();
        timer->cancel();
        timer->schedule(20ms, 0ms);
        destroyed->schedule(20ms, 0ms);
        timer->cancel();
        destroyed.reset();
        const bool undisturbed = this->harness.clock().uptime() - start < 20ms;
        laterTimer->schedule(30ms, 0ms);
        EXPECT_TRUE(this->waitFor(later));
        EXPECT_TRUE(!undisturbed || fired.count() == 0U);
        const auto before = fired.count();
        timer->schedule(-1s, 0ms);
        EXPECT_TRUE(this->waitFor(fired, before + 1)) << "a cancelled timer can be armed again";
        timer.reset();
        queue->sync([] {});
        return undisturbed;
    });
}

TYPED_TEST(WorkQueuesTest, timerWithoutDelayFiresAndItsHandlerMayDestroyIt)
{
    const Queue queue = this->serialQueue("timer");
    Events fired;
    std::unique_ptr<Timer> timer;
    queue->sync([&] {
        timer = this->queues().createTimer(*queue, [&] {
            timer.reset();
            fired.happen();
        });
        timer->schedule(0ms, 0ms);
    });
    ASSERT_TRUE(this->waitFor(fired));
}

TYPED_TEST(WorkQueuesTest, timersFireInTheOrderOfTheirTimes)
{
    repeatUntilUndisturbed([this] {
        const Queue queue = this->serialQueue("timer");
        std::vector<int> order;
        Events fired;
        std::vector<std::unique_ptr<Timer>> timers;
        const nanoseconds start = this->harness.clock().uptime();
        for (const int delay : {60, 20, 40}) {
            timers.push_back(this->queues().createTimer(*queue, [&order, &fired, delay] {
                order.push_back(delay);
                fired.happen();
            }));
            timers.back()->schedule(std::chrono::milliseconds(delay), 0ms);
        }
        const bool undisturbed = this->harness.clock().uptime() - start < 20ms;
        EXPECT_TRUE(this->waitFor(fired, 3));
        queue->sync([] {});
        EXPECT_TRUE(!undisturbed || order == std::vector<int>({20, 40, 60})) << testing::PrintToString(order);
        return undisturbed;
    });
}

// Pauses

Task<void> pauseFor(WorkQueues* queues, nanoseconds duration, Events* after)
{
    Task<void> pause = queues->pause(duration);
    co_await std::move(pause);
    after->happen();
}

TYPED_TEST(WorkQueuesTest, pauseHoldsTheQueueForItsDurationButNoThread)
{
    constexpr unsigned count = 100;
    Events after;
    std::vector<Queue> pausing;
    const nanoseconds start = this->harness.clock().uptime();
    for (unsigned i = 0; i < count; ++i) {
        pausing.push_back(this->serialQueue("pausing"));
        pausing.back()->async(pauseFor(&this->queues(), 30ms, &after));
    }
    Events other;
    this->serialQueue("free")->async([&other] { other.happen(); });
    ASSERT_TRUE(this->waitFor(other));
    ASSERT_TRUE(this->waitFor(after, count));
    EXPECT_GE(this->harness.clock().uptime() - start, 30ms);
}

TYPED_TEST(WorkQueuesTest, pauseOfNoTimeEnds)
{
    Events after;
    this->run(pauseFor(&this->queues(), 0ms, &after));
    this->run(pauseFor(&this->queues(), -1h, &after));
    EXPECT_EQ(after.count(), 2U);
}

// The main queue

TYPED_TEST(WorkQueuesTest, mainQueueKeepsItsWorkForTheMainLoopAndRunsItThere)
{
    WorkQueue& main = this->queues().mainQueue();
    std::vector<int> order;
    std::vector<std::thread::id> threads;
    Events ended;
    for (int i = 0; i < 3; ++i) {
        main.async([&, i] {
            order.push_back(i);
            threads.push_back(std::this_thread::get_id());
            ended.happen();
        });
    }
    this->harness.startMainLoop();
    ASSERT_TRUE(this->waitFor(ended, 3));
    main.sync([&threads] { threads.push_back(std::this_thread::get_id()); });
    EXPECT_THAT(order, ElementsAre(0, 1, 2));
    EXPECT_THAT(threads, testing::Each(this->harness.mainThread()));
}

Task<void> resumeOnMain(std::shared_ptr<Semaphore> gate, std::vector<std::thread::id>* threads, Events* ended)
{
    threads->push_back(std::this_thread::get_id());
    Task<void> turn = gate->wait();
    co_await std::move(turn);
    threads->push_back(std::this_thread::get_id());
    ended->happen();
}

TYPED_TEST(WorkQueuesTest, suspendedWorkOfTheMainQueueGoesOnOnTheMainThread)
{
    const auto gate = this->queues().createSemaphore(0);
    std::vector<std::thread::id> threads;
    Events ended;
    this->queues().mainQueue().async(resumeOnMain(gate, &threads, &ended));
    this->harness.startMainLoop();
    this->serialQueue("a")->async([gate] { gate->signal(); });
    ASSERT_TRUE(this->waitFor(ended));
    EXPECT_THAT(threads, testing::Each(this->harness.mainThread()));
}

}  // namespace

}  // namespace typhon::test
