#include "platform/simulated/simulated_clock.h"
#include "platform/simulated/simulated_scheduler.h"
#include "platform/simulated/simulated_work_queues.h"

#include <memory>
#include <set>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

/// One run: a few queues that post, await, pause and share a semaphore, and the order in which it went.
class SampleRun {
public:
    explicit SampleRun(std::uint64_t seed) : scheduler_(seed)
    {
        for (int i = 0; i < 4; ++i) {
            queues_.push_back(workQueues_.createSerialQueue("queue"));
        }
        for (int i = 0; i < 4; ++i) {
            const auto number = static_cast<std::size_t>(i);
            queues_[number]->async(work(this, queues_[(number + 1) % 2], i));
            queues_[number]->async([this, i] { note("posted", i); });
        }
        scheduler_.advance(10s);
    }
    const std::vector<std::string>& order() const { return order_; }

private:
    void note(const std::string& what, int i) { order_.push_back(what + std::to_string(i)); }

    static Task<void> work(SampleRun* run, std::shared_ptr<WorkQueue> other, int i)
    {
        run->note("begun", i);
        Task<void> turn = run->semaphore_->wait();
        co_await std::move(turn);
        Task<void> pause = run->workQueues_.pause(1s);
        co_await std::move(pause);
        run->semaphore_->signal();
        if (&WorkItem::current()->queue != other.get() && i >= 2) {
            std::function<void()> step = [run, i] { run->note("performed", i); };
            Task<void> performed = other->perform(std::move(step));
            co_await std::move(performed);
        }
        run->note("ended", i);
    }

    SimulatedScheduler scheduler_;
    SimulatedWorkQueues workQueues_{scheduler_};
    std::vector<std::shared_ptr<WorkQueue>> queues_;
    std::shared_ptr<Semaphore> semaphore_ = workQueues_.createSemaphore(1);
    std::vector<std::string> order_;
};

TEST(SimulatedScheduler, sameSeedGivesTheSameRun)
{
    for (std::uint64_t seed = 0; seed < 20; ++seed) {
        const SampleRun first(seed);
        EXPECT_EQ(first.order(), SampleRun(seed).order()) << "seed " << seed;
        EXPECT_EQ(first.order().size(), 14U);
    }
}

TEST(SimulatedScheduler, differentSeedsGiveDifferentRuns)
{
    std::set<std::vector<std::string>> orders;
    for (std::uint64_t seed = 0; seed < 50; ++seed) {
        orders.insert(SampleRun(seed).order());
    }
    EXPECT_GT(orders.size(), 10U);
}

TEST(SimulatedScheduler, keepsTheOrderWithinALaneButNotBetweenLanes)
{
    std::set<std::string> orders;
    for (std::uint64_t seed = 0; seed < 100; ++seed) {
        SimulatedScheduler scheduler(seed);
        std::string order;
        const int lanes[2] = {};
        scheduler.post(&lanes[0], [&order] { order += 'a'; });
        scheduler.post(&lanes[0], [&order] { order += 'b'; });
        scheduler.post(&lanes[1], [&order] { order += 'x'; });
        scheduler.runUntilIdle();
        orders.insert(order);
    }
    EXPECT_THAT(orders, ElementsAre("abx", "axb", "xab"));
}

TEST(SimulatedScheduler, awaitedWorkBeginsAtOnceOrLaterAsTheSeedDecides)
{
    std::set<std::string> orders;
    for (std::uint64_t seed = 0; seed < 100; ++seed) {
        SimulatedScheduler scheduler(seed);
        SimulatedWorkQueues queues(scheduler);
        std::string order;
        const auto queue = queues.createSerialQueue("connection");
        queue->asyncForConnection(std::make_shared<int>(), detail::callAsTask([&order] { order += 'h'; }));
        order += 'r';
        scheduler.runUntilIdle();
        orders.insert(order);
    }
    EXPECT_THAT(orders, ElementsAre("hr", "rh"));
}

TEST(SimulatedScheduler, threeHoursPassInNoTime)
{
    SimulatedScheduler scheduler(1);
    SimulatedWorkQueues queues(scheduler);
    const SimulatedClock clock(scheduler);
    const auto queue = queues.createSerialQueue("timer");
    const auto start = clock.uptime();
    const double wallStart = clock.now();
    std::vector<std::chrono::nanoseconds> fired;
    const auto timer = queues.createTimer(*queue, [&] { fired.push_back(clock.uptime() - start); });
    timer->schedule(10'800s, 0s);
    scheduler.advance(10'800s - 1ns);
    EXPECT_TRUE(fired.empty());
    scheduler.advance(1ns);
    EXPECT_THAT(fired, ElementsAre(10'800s));
    EXPECT_DOUBLE_EQ(clock.now() - wallStart, 10'800.0);
}

TEST(SimulatedScheduler, timerFiresWithinItsWindowAtAMomentThatTheSeedDecides)
{
    std::set<std::chrono::nanoseconds> moments;
    for (std::uint64_t seed = 0; seed < 50; ++seed) {
        SimulatedScheduler scheduler(seed);
        SimulatedWorkQueues queues(scheduler);
        const auto queue = queues.createSerialQueue("timer");
        const auto start = scheduler.uptime();
        const auto timer = queues.createTimer(*queue, [&] { moments.insert(scheduler.uptime() - start); });
        timer->schedule(10s, 4s);
        scheduler.advance(20s);
    }
    EXPECT_GE(*moments.begin(), 10s);
    EXPECT_LE(*moments.rbegin(), 14s);
    EXPECT_GT(moments.size(), 25U);
}

TEST(SimulatedScheduler, timeStandsStillUntilItIsAdvanced)
{
    SimulatedScheduler scheduler(1);
    const auto start = scheduler.uptime();
    std::vector<int> order;
    scheduler.schedule(2s, [&] { order.push_back(2); });
    scheduler.schedule(1s, [&] {
        order.push_back(1);
        scheduler.schedule(500ms, [&order] { order.push_back(15); });
    });
    scheduler.schedule(0s, [&order] { order.push_back(0); });
    scheduler.runUntilIdle();
    EXPECT_THAT(order, ElementsAre(0));
    EXPECT_EQ(scheduler.uptime(), start);
    scheduler.advance(3s);
    EXPECT_THAT(order, ElementsAre(0, 1, 15, 2));
    EXPECT_EQ(scheduler.uptime(), start + 3s);
}

TEST(SimulatedScheduler, cancelledJobDoesNotRun)
{
    SimulatedScheduler scheduler(1);
    bool ran = false;
    const auto key = scheduler.schedule(1s, [&ran] { ran = true; });
    scheduler.cancel(key);
    scheduler.advance(2s);
    EXPECT_FALSE(ran);
}

TEST(SimulatedScheduler, steppingTheWallClockLeavesTimersAlone)
{
    SimulatedScheduler scheduler(1);
    const SimulatedClock clock(scheduler);
    bool ran = false;
    scheduler.schedule(10s, [&ran] { ran = true; });
    const double before = clock.now();
    const auto uptime = clock.uptime();
    scheduler.stepWallClock(3600);
    EXPECT_DOUBLE_EQ(clock.now(), before + 3600);
    scheduler.stepWallClock(-7200);
    EXPECT_DOUBLE_EQ(clock.now(), before - 3600);
    EXPECT_EQ(clock.uptime(), uptime);
    scheduler.runUntilIdle();
    EXPECT_FALSE(ran);
    scheduler.advance(10s);
    EXPECT_TRUE(ran);
}

TEST(SimulatedScheduler, runUntilStopsAtThePredicateOrWhenNothingIsLeft)
{
    SimulatedScheduler scheduler(1);
    const auto start = scheduler.uptime();
    int count = 0;
    for (int i = 1; i <= 3; ++i) {
        scheduler.schedule(std::chrono::seconds(i), [&count] { ++count; });
    }
    EXPECT_TRUE(scheduler.runUntil([&count] { return count == 2; }));
    EXPECT_EQ(scheduler.uptime() - start, 2s);
    EXPECT_FALSE(scheduler.runUntil([&count] { return count == 5; }));
    EXPECT_EQ(count, 3);
}

Task<void> holdForGood()
{
    auto never = awaitCompletion<void>([](const std::function<void()>&) {});
    co_await never;
}

TEST(SimulatedWorkQueuesDeathTest, syncOnAQueueThatIsHeldForGoodAborts)
{
    SimulatedScheduler scheduler(1);
    SimulatedWorkQueues queues(scheduler);
    const auto queue = queues.createSerialQueue("queue a");
    queue->async(holdForGood());
    EXPECT_DEATH(queue->sync([] {}), "nothing is left to run, but queue \"queue a\" is held");
}

}  // namespace

}  // namespace typhon
