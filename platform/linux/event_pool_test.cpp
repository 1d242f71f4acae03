#include "platform/linux/event_pool.h"
#include "platform/linux/file_descriptor.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace typhon {

namespace {

/// A number that threads change and wait for.
class Count {
public:
    void add(int difference)
    {
        const std::lock_guard lock(mutex_);
        value_ += difference;
        peak_ = std::max(peak_, value_);
        changed_.notify_all();
    }
    bool waitFor(int value)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, std::chrono::seconds(60), [&] { return value_ >= value; });
    }
    int value() const
    {
        const std::lock_guard lock(mutex_);
        return value_;
    }
    int peak() const
    {
        const std::lock_guard lock(mutex_);
        return peak_;
    }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    int value_ = 0;
    int peak_ = 0;
};

struct Pair {
    Pair()
    {
        int ends[2] = {-1, -1};
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends), 0);
        near = FileDescriptor(ends[0]);
        far = FileDescriptor(ends[1]);
    }
    void write(const std::string& text) const
    {
        ASSERT_EQ(::write(far.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
    }
    FileDescriptor near;
    FileDescriptor far;
};

TEST(EventPool, runsPostedJobsInOrderOnItsThreads)
{
    EventPool pool(EventPool::Options{.minimumThreads = 1, .maximumThreads = 1});
    std::vector<int> order;
    Count done;
    bool onPool = true;
    for (int i = 0; i < 1000; ++i) {
        pool.post([&, i] {
            order.push_back(i);
            onPool = onPool && pool.isPoolThread();
            done.add(1);
        });
    }
    ASSERT_TRUE(done.waitFor(1000));
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
    EXPECT_TRUE(onPool);
    EXPECT_FALSE(pool.isPoolThread());
}

TEST(EventPool, jobWakesAnIdleThread)
{
    EventPool pool;
    Count done;
    for (int i = 1; i <= 200; ++i) {
        // One after the other, so that the threads go idle in between.
        pool.post([&done] { done.add(1); });
        ASSERT_TRUE(done.waitFor(i));
    }
}

TEST(EventPool, jobsThatWaitForEachOtherGetThreadsUpToTheCapAndNeverMore)
{
    EventPool pool(EventPool::Options{.minimumThreads = 2, .maximumThreads = 8});
    EXPECT_EQ(pool.maximumThreads(), 8U);
    Count running;
    Count released;
    Count ended;
    for (int i = 0; i < 50; ++i) {
        pool.post([&] {
            running.add(1);
            released.waitFor(1);
            running.add(-1);
            ended.add(1);
        });
    }
    EXPECT_TRUE(running.waitFor(8));
    EXPECT_EQ(pool.threadCount(), 8U);
    released.add(1);
    ASSERT_TRUE(ended.waitFor(50));
    EXPECT_EQ(running.peak(), 8);
    EXPECT_EQ(pool.threadCount(), 8U);
}

TEST(EventPool, eventsAreHandledWhileJobsKeepAllThreadsBusy)
{
    EventPool pool(EventPool::Options{.minimumThreads = 2, .maximumThreads = 2});
    const Pair pair;
    std::atomic<bool> handled{false};
    Count ended;
    const auto watch = pool.watch(pair.near.get(), [&handled](std::uint32_t) { handled = true; });
    watch->arm(EPOLLIN);
    pair.write("x");
    // Jobs without end, until the event has got its turn.
    std::function<void()> again = [&] {
        if (handled) {
            ended.add(1);
        } else {
            pool.post(again);
        }
    };
    for (int i = 0; i < 4; ++i) {
        pool.post(again);
    }
    EXPECT_TRUE(ended.waitFor(4));
}

TEST(EventPool, watchReportsOneEventForEachArming)
{
    EventPool pool;
    const Pair pair;
    Count events;
    const auto watch = pool.watch(pair.near.get(), [&events](std::uint32_t what) {
        EXPECT_TRUE(what & EPOLLIN);
        events.add(1);
    });
    pair.write("never read");
    Count jobs;
    const auto passThroughThePool = [&] {
        const int before = jobs.value();
        pool.post([&jobs] { jobs.add(1); });
        ASSERT_TRUE(jobs.waitFor(before + 1));
    };
    passThroughThePool();
    EXPECT_EQ(events.value(), 0) << "not armed yet";
    for (int armings = 1; armings <= 3; ++armings) {
        watch->arm(EPOLLIN);
        ASSERT_TRUE(events.waitFor(armings));
        passThroughThePool();
        EXPECT_EQ(events.value(), armings);
    }
}

TEST(EventPool, watchReportsAHangUpOnlyWhenArmed)
{
    // Its only thread handles events in their order.
    EventPool pool(EventPool::Options{.minimumThreads = 1, .maximumThreads = 1});
    Pair pair;
    const Pair later;
    Count events;
    Count laterEvents;
    std::atomic<std::uint32_t> what{0};
    const auto watch = pool.watch(pair.near.get(), [&](std::uint32_t reported) {
        what = reported;
        events.add(1);
    });
    pair.far = FileDescriptor();
    const auto laterWatch =
        pool.watch(later.near.get(), [&laterEvents](std::uint32_t) { laterEvents.add(1); });
    later.write("x");
    laterWatch->arm(EPOLLIN);
    ASSERT_TRUE(laterEvents.waitFor(1));
    EXPECT_EQ(events.value(), 0);
    watch->arm(0);
    ASSERT_TRUE(events.waitFor(1));
    EXPECT_TRUE(what & EPOLLHUP);
}

TEST(EventPool, handlerMayDestroyItsOwnWatchAndRearmIt)
{
    EventPool pool;
    const Pair pair;
    Count events;
    struct State {
        // The next handler begins before the arming returns, and the last one destroys what was armed.
        std::mutex mutex;
        std::unique_ptr<EventPool::Watch> watch;
        int left = 100;
    };
    const auto state = std::make_shared<State>();
    state->watch = pool.watch(pair.near.get(), [state, &events](std::uint32_t) {
        {
            const std::lock_guard lock(state->mutex);
            if (--state->left > 0) {
                state->watch->arm(EPOLLIN);
            } else {
                state->watch.reset();
            }
        }
        events.add(1);
    });
    pair.write("x");
    {
        const std::lock_guard lock(state->mutex);
        state->watch->arm(EPOLLIN);
    }
    ASSERT_TRUE(events.waitFor(100));
}

TEST(EventPool, handlerOwnsItsStateWhileWatchesAreDestroyedUnderIt)
{
    EventPool pool;
    std::atomic<int> calls{0};
    for (int round = 0; round < 500; ++round) {
        const Pair pair;
        const auto owned = std::make_shared<std::string>("still here, and too long for a small string");
        auto watch = pool.watch(pair.near.get(),
                                [owned, &calls](std::uint32_t) { calls += owned->size() > 20 ? 1 : 1000; });
        watch->arm(EPOLLIN);
        pair.write("x");
        // Sometimes before, sometimes during, sometimes after the handler.
        watch.reset();
    }
    pool.stop();
    EXPECT_LE(calls, 500);
}

TEST(EventPool, handlerObjectIsCalledAsLongAsItIsThere)
{
    struct Counter final : EventPool::Handler {
        Counter(Count& calls, Count& ends) : called(calls), ended(ends) {}
        ~Counter() override { ended.add(1); }
        void handleEvents(std::uint32_t) override { called.add(1); }
        Count& called;
        Count& ended;
    };
    EventPool pool;
    Count called;
    Count ended;
    const Pair pair;
    auto handler = std::make_shared<Counter>(called, ended);
    auto watch = pool.watch(pair.near.get(), handler);
    watch.arm(EPOLLIN);
    pair.write("x");
    ASSERT_TRUE(called.waitFor(1));
    handler.reset();
    ASSERT_TRUE(ended.waitFor(1));
    watch.arm(EPOLLIN);
    const Pair other;
    Count turns;
    const auto turn = pool.watch(other.near.get(), [&turns](std::uint32_t) { turns.add(1); });
    turn->arm(EPOLLIN);
    other.write("x");
    ASSERT_TRUE(turns.waitFor(1));
    watch = {};
    pool.stop();
    EXPECT_EQ(called.value(), 1);
}

TEST(EventPool, reusedDescriptorGetsNoEventsOfTheEarlierOne)
{
    // Starting another thread would open a descriptor for a moment, for its name.
    EventPool pool(EventPool::Options{.minimumThreads = 2, .maximumThreads = 2});
    std::atomic<int> stale{0};
    Count fresh;
    for (int round = 1; round <= 200; ++round) {
        int number = -1;
        {
            const Pair pair;
            number = pair.near.get();
            auto watch = pool.watch(number, [](std::uint32_t) {});
            watch->arm(EPOLLIN);
            pair.write("x");
        }
        const Pair again;
        ASSERT_EQ(again.near.get(), number);
        const auto watch = pool.watch(number, [&](std::uint32_t) { ++stale; });
        watch->arm(EPOLLIN);
        pool.post([&fresh] { fresh.add(1); });
        ASSERT_TRUE(fresh.waitFor(round));
    }
    pool.stop();
    EXPECT_EQ(stale, 0);
}

/// The pool's threads, as the kernel sees them.
struct PoolThreads {
    bool allAsleep = true;
    /// How often each was given a processor, and let it go.
    std::map<std::string, std::string> switches;
};

PoolThreads poolThreads()
{
    PoolThreads threads;
    for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
        std::ifstream status(task.path() / "status");
        std::string name;
        std::string state;
        std::string switches;
        for (std::string line; std::getline(status, line);) {
            name = line.starts_with("Name:") ? line : name;
            state = line.starts_with("State:") ? line : state;
            switches += line.find("ctxt_switches") != std::string::npos ? line : "";
        }
        if (name == "Name:\ttyphon-pool") {
            threads.allAsleep = threads.allAsleep && state.starts_with("State:\tS");
            threads.switches[task.path()] = switches;
        }
    }
    return threads;
}

TEST(EventPool, idleThreadsBurnNoProcessorTime)
{
    EventPool pool(EventPool::Options{.minimumThreads = 8, .maximumThreads = 8});
    Count done;
    for (int i = 0; i < 100; ++i) {
        pool.post([&done] { done.add(1); });
    }
    ASSERT_TRUE(done.waitFor(100));
    // Asleep, and not woken in between however often one looks: a thread that spins never gets that far.
    constexpr int looks = 100;
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    PoolThreads seen;
    for (int same = 0; same < looks;) {
        ASSERT_LT(std::chrono::steady_clock::now(), deadline) << "the threads do not come to rest";
        auto now = poolThreads();
        same = now.allAsleep && now.switches == seen.switches ? same + 1 : 0;
        seen = std::move(now);
    }
    EXPECT_EQ(seen.switches.size(), 8U);
}

TEST(EventPool, blocksSignalsOnItsThreads)
{
    EventPool pool;
    Count done;
    sigset_t blocked;
    sigemptyset(&blocked);
    pool.post([&] {
        pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
        done.add(1);
    });
    ASSERT_TRUE(done.waitFor(1));
    EXPECT_TRUE(sigismember(&blocked, SIGTERM));
    EXPECT_TRUE(sigismember(&blocked, SIGINT));
    sigset_t here;
    pthread_sigmask(SIG_BLOCK, nullptr, &here);
    EXPECT_FALSE(sigismember(&here, SIGTERM));
}

/// Waits until the pool takes no jobs any more: then one is dropped at once, with what it holds.
void waitUntilStopping(EventPool& pool)
{
    for (;;) {
        const auto probe = std::make_shared<int>(0);
        pool.post([probe] {});
        if (probe.use_count() == 1) {
            return;
        }
        std::this_thread::yield();
    }
}

TEST(EventPool, stopFinishesWhatRunsAndDropsTheRest)
{
    EventPool pool(EventPool::Options{.minimumThreads = 1, .maximumThreads = 1});
    Count begun;
    std::atomic<bool> finished{false};
    std::atomic<bool> ranLater{false};
    const auto held = std::make_shared<int>(1);
    pool.post([&] {
        begun.add(1);
        waitUntilStopping(pool);
        finished = true;
    });
    ASSERT_TRUE(begun.waitFor(1));
    pool.post([&ranLater, held] { ranLater = true; });
    const Pair pair;
    const auto watch = pool.watch(pair.near.get(), [held](std::uint32_t) {});
    pool.stop();
    EXPECT_TRUE(finished);
    EXPECT_FALSE(ranLater);
    EXPECT_EQ(held.use_count(), 1);
    pool.post([&ranLater] { ranLater = true; });
    EXPECT_FALSE(ranLater);
}

}  // namespace

}  // namespace typhon
