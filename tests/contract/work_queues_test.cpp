// What every implementation of the work queues promises. Each test runs on Linux, with a pool of four
// threads, and in the simulation under several seeds.

#include "work_queues_harness.h"

#include <algorithm>
#include <memory>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon::test {

namespace {

using testing::ElementsAre;

TYPED_TEST_SUITE(WorkQueuesTest, Harnesses);

TYPED_TEST(WorkQueuesTest, serialQueueRunsWorkInOrderOfSubmission)
{
    const Queue queue = this->serialQueue("a");
    std::vector<int> order;
    for (int i = 0; i < 100; ++i) {
        queue->async([&order, i] { order.push_back(i); });
    }
    queue->sync([] {});
    ASSERT_EQ(order.size(), 100U);
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TYPED_TEST(WorkQueuesTest, serialQueueRunsOneItemAtATimeSuspensionsIncluded)
{
    const Queue queue = this->serialQueue("a");
    const auto gate = this->queues().createSemaphore(0);
    std::vector<std::string> order;
    Events ended;
    queue->async(waitThen(gate, [&order] { order.push_back("first"); }));
    queue->async([&order] { order.push_back("second"); });
    queue->async([&ended] { ended.happen(); });

    // Another queue gets its work done while the first one is held.
    Events other;
    this->serialQueue("b")->async([&other] { other.happen(); });
    ASSERT_TRUE(this->waitFor(other));
    EXPECT_EQ(ended.count(), 0U);

    gate->signal();
    ASSERT_TRUE(this->waitFor(ended));
    EXPECT_THAT(order, ElementsAre("first", "second"));
}

TYPED_TEST(WorkQueuesTest, suspendedTasksHoldTheirQueuesButNoThreads)
{
    constexpr unsigned count = 500;
    const auto gate = this->queues().createSemaphore(0);
    Events resumed;
    Events behind;
    std::vector<Queue> held;
    for (unsigned i = 0; i < count; ++i) {
        held.push_back(this->serialQueue("held"));
        held.back()->async(waitThen(gate, [&resumed] { resumed.happen(); }));
        held.back()->async([&behind] { behind.happen(); });
    }
    Events other;
    this->serialQueue("free")->async([&other] { other.happen(); });
    ASSERT_TRUE(this->waitFor(other)) << "suspended tasks use up the threads";
    EXPECT_EQ(behind.count(), 0U) << "a suspended task does not hold its queue";

    for (unsigned i = 0; i < count; ++i) {
        gate->signal();
    }
    ASSERT_TRUE(this->waitFor(behind, count));
    EXPECT_EQ(resumed.count(), count);
}

TYPED_TEST(WorkQueuesTest, tenThousandQueuedItemsDoNotOverflowTheStack)
{
    const Queue queue = this->serialQueue("a");
    const auto gate = this->queues().createSemaphore(0);
    Events events;
    queue->async(waitThen(gate, [] {}));
    for (unsigned i = 0; i < 10'000; ++i) {
        queue->async([&events] { events.happen(); });
    }
    gate->signal();
    ASSERT_TRUE(this->waitFor(events, 10'000));
}

Task<void> performManyTimes(Queue queue, unsigned times, unsigned* sum)
{
    for (unsigned i = 0; i < times; ++i) {
        Task<unsigned> one = queue->perform([] { return 1U; });
        *sum += co_await std::move(one);
    }
}

TYPED_TEST(WorkQueuesTest, tenThousandAwaitedItemsDoNotOverflowTheStack)
{
    unsigned sum = 0;
    this->run(performManyTimes(this->serialQueue("a"), 10'000, &sum));
    EXPECT_EQ(sum, 10'000U);
}

TYPED_TEST(WorkQueuesTest, queueThatNobodyHoldsFinishesItsWork)
{
    const auto gate = this->queues().createSemaphore(0);
    Events events;
    Queue queue = this->serialQueue("a");
    queue->async(waitThen(gate, [&events] { events.happen(); }));
    queue->async([&events] { events.happen(); });
    queue.reset();
    gate->signal();
    ASSERT_TRUE(this->waitFor(events, 2));
}

Task<void> letGoOf(std::shared_ptr<Queue> queue)
{
    queue->reset();
    co_return;
}

TYPED_TEST(WorkQueuesTest, workMayLetGoOfItsOwnQueue)
{
    const auto queue = std::make_shared<Queue>(this->serialQueue("a"));
    Events events;
    const Queue kept = *queue;
    kept->async(letGoOf(queue));
    kept->async([&events] { events.happen(); });
    ASSERT_TRUE(this->waitFor(events));
}

// perform

struct Unusual {
    explicit Unusual(int number) : value(std::make_unique<int>(number)) {}
    std::unique_ptr<int> value;
};

Task<Unusual> makeUnusual(int number)
{
    co_return Unusual(number);
}

Task<void> performForValues(Queue queue, int* fromFunction, int* fromTask)
{
    Task<int> function = queue->perform([] { return 3; });
    *fromFunction = co_await std::move(function);
    Task<Unusual> task = queue->perform(makeUnusual(4));
    const Unusual unusual = co_await std::move(task);
    *fromTask = *unusual.value;
}

TYPED_TEST(WorkQueuesTest, performGivesTheValueOfFunctionOrTask)
{
    int fromFunction = 0;
    int fromTask = 0;
    this->run(performForValues(this->serialQueue("a"), &fromFunction, &fromTask));
    EXPECT_EQ(fromFunction, 3);
    EXPECT_EQ(fromTask, 4);
}

TYPED_TEST(WorkQueuesTest, performWorksOnConcurrentAndMainQueues)
{
    int fromFunction = 0;
    int fromTask = 0;
    this->harness.startMainLoop();
    for (WorkQueue* queue :
         {&this->queues().concurrentQueue(Priority::defaultPriority),
          &this->queues().concurrentQueue(Priority::background), &this->queues().mainQueue()}) {
        this->run(performForValues(Queue(Queue(), queue), &fromFunction, &fromTask));
        EXPECT_EQ(std::exchange(fromFunction, 0), 3);
        EXPECT_EQ(std::exchange(fromTask, 0), 4);
    }
}

Task<void> throwAfterWait(std::shared_ptr<Semaphore> semaphore)
{
    Task<void> turn = semaphore->wait();
    co_await std::move(turn);
    throw std::runtime_error("thrown on the other queue");
}

Task<void> catchFrom(Queue queue, std::shared_ptr<Semaphore> semaphore, std::string* caught)
{
    try {
        Task<void> failing = queue->perform(throwAfterWait(semaphore));
        co_await std::move(failing);
    } catch (const std::runtime_error& error) {
        *caught = error.what();
    }
}

TYPED_TEST(WorkQueuesTest, performThrowsTheExceptionOfTheWork)
{
    std::string caught;
    const Queue queue = this->serialQueue("a");
    this->run(catchFrom(queue, this->queues().createSemaphore(1), &caught));
    EXPECT_EQ(caught, "thrown on the other queue");
    Events events;
    queue->async([&events] { events.happen(); });
    ASSERT_TRUE(this->waitFor(events)) << "the queue is still held";
}

TYPED_TEST(WorkQueuesTest, performWaitsBehindEarlierWork)
{
    const Queue queue = this->serialQueue("a");
    const auto gate = this->queues().createSemaphore(0);
    std::vector<std::string> order;
    queue->async(waitThen(gate, [&order] { order.push_back("held"); }));
    queue->async([&order] { order.push_back("posted"); });
    Events ended;
    const Queue caller = this->serialQueue("b");
    unsigned sum = 0;
    caller->async(performManyTimes(queue, 1, &sum));
    caller->async([&order] { order.push_back("performed"); });
    caller->async([&ended] { ended.happen(); });
    gate->signal();
    ASSERT_TRUE(this->waitFor(ended));
    EXPECT_THAT(order, ElementsAre("held", "posted", "performed"));
}

// The connection that work is done for

using Connections = std::vector<std::shared_ptr<void>>;

std::shared_ptr<void> connectionOfCurrentItem()
{
    return WorkItem::current()->connection;
}

Task<void> collectConnections(Queue other, Connections* seen, Events* posted)
{
    seen->push_back(connectionOfCurrentItem());
    Task<std::shared_ptr<void>> performed = other->perform(connectionOfCurrentItem);
    seen->push_back(co_await std::move(performed));
    other->sync([seen] { seen->push_back(connectionOfCurrentItem()); });
    other->async([seen, posted] {
        seen->push_back(connectionOfCurrentItem());
        posted->happen();
    });
    auto settled = awaitCompletion<void>([other](std::function<void()> done) { other->async(done); });
    co_await settled;
    seen->push_back(connectionOfCurrentItem());
}

TYPED_TEST(WorkQueuesTest, awaitedWorkInheritsTheConnectionAndPostedWorkDoesNot)
{
    const auto connection = std::make_shared<int>(7);
    const Queue queue = this->serialQueue("connection");
    Connections seen;
    Events posted;
    Events ended;
    queue->asyncForConnection(connection, collectConnections(this->serialQueue("other"), &seen, &posted));
    queue->async([&ended] { ended.happen(); });
    ASSERT_TRUE(this->waitFor(ended));
    ASSERT_TRUE(this->waitFor(posted));
    EXPECT_THAT(seen, ElementsAre(connection, connection, connection, nullptr, connection));
    EXPECT_EQ(WorkItem::current(), nullptr);
}

TYPED_TEST(WorkQueuesTest, workForAConnectionKeepsItsPlaceInTheOrder)
{
    const Queue queue = this->serialQueue("connection");
    std::vector<int> order;
    Events ended;
    queue->async([&order] { order.push_back(1); });
    queue->asyncForConnection(std::make_shared<int>(), detail::callAsTask([&order] { order.push_back(2); }));
    queue->async([&order] { order.push_back(3); });
    queue->async([&ended] { ended.happen(); });
    ASSERT_TRUE(this->waitFor(ended));
    EXPECT_THAT(order, ElementsAre(1, 2, 3));
}

// sync

TYPED_TEST(WorkQueuesTest, syncRunsBehindEarlierWorkAndThrowsWhatTheWorkThrows)
{
    const Queue queue = this->serialQueue("a");
    std::vector<int> order;
    queue->async([&order] { order.push_back(1); });
    EXPECT_THROW(queue->sync([&order] {
        order.push_back(2);
        throw std::runtime_error("no");
    }),
                 std::runtime_error);
    queue->sync([&order] { order.push_back(3); });
    EXPECT_THAT(order, ElementsAre(1, 2, 3));
}

TYPED_TEST(WorkQueuesTest, syncWaitsForTheEndOfASuspendedTask)
{
    const Queue queue = this->serialQueue("a");
    const auto gate = this->queues().createSemaphore(0);
    bool resumed = false;
    queue->async(waitThen(gate, [&resumed] { resumed = true; }));
    this->serialQueue("b")->async([gate] { gate->signal(); });
    bool resumedBefore = false;
    queue->sync([&] { resumedBefore = resumed; });
    EXPECT_TRUE(resumedBefore);
}

TYPED_TEST(WorkQueuesTest, allThreadsMayWaitInSyncForPostedWork)
{
    // Many more callers than threads, each behind work that needs a thread itself.
    const Queue shared = this->serialQueue("shared");
    Events events;
    std::vector<Queue> callers;
    for (unsigned i = 0; i < 50; ++i) {
        callers.push_back(this->serialQueue("caller"));
        callers.back()->async([shared, &events] {
            shared->async([&events] { events.happen(); });
            shared->sync([&events] { events.happen(); });
        });
    }
    ASSERT_TRUE(this->waitFor(events, 100));
}

// Waiting for a queue that one holds

template <class Harness>
class WorkQueuesDeathTest : public WorkQueuesTest<Harness> {
protected:
    WorkQueuesDeathTest() { GTEST_FLAG_SET(death_test_style, "threadsafe"); }
};
TYPED_TEST_SUITE(WorkQueuesDeathTest, Harnesses);

Task<void> performOn(Queue queue)
{
    Task<int> waiting = queue->perform([] { return 0; });
    co_await std::move(waiting);
}

Task<void> performOnThrough(Queue queue, Queue through)
{
    Task<void> waiting = through->perform(performOn(queue));
    co_await std::move(waiting);
}

Task<void> syncOn(Queue queue)
{
    queue->sync([] {});
    co_return;
}

Task<void> syncOnThrough(Queue queue, Queue through)
{
    Task<void> waiting = through->perform(syncOn(queue));
    co_await std::move(waiting);
}

TYPED_TEST(WorkQueuesDeathTest, waitingForTheOwnQueueAborts)
{
    const Queue a = this->serialQueue("queue a");
    const std::string message = "work on \"queue a\" waits for queue \"queue a\", which it holds";
    EXPECT_DEATH(this->run(a, performOn(a)), message);
    EXPECT_DEATH(this->run(a, syncOn(a)), message);
    EXPECT_DEATH(a->sync([&a] { a->sync([] {}); }), message);
}

TYPED_TEST(WorkQueuesDeathTest, waitingForTheOwnQueueThroughAnotherAborts)
{
    const Queue a = this->serialQueue("queue a");
    const Queue b = this->serialQueue("queue b");
    const std::string message = "work on \"queue b\" waits for queue \"queue a\", which it holds";
    EXPECT_DEATH(this->run(a, performOnThrough(a, b)), message);
    EXPECT_DEATH(this->run(a, syncOnThrough(a, b)), message);
    EXPECT_DEATH(a->sync([&] { b->sync([&] { a->sync([] {}); }); }), message);
}

TYPED_TEST(WorkQueuesDeathTest, exceptionOfPostedWorkEndsTheProcess)
{
    const Queue a = this->serialQueue("queue a");
    EXPECT_DEATH(this->run(a, detail::callAsTask([] { throw std::runtime_error("nobody waits"); })),
                 "work on \"queue a\" failed: nobody waits");
}

// The end

struct Frame {
    std::shared_ptr<int> content;
    Queue posts;
    /// What unwinding code of real frames does: it hands more work to queues.
    ~Frame()
    {
        if (posts) {
            posts->async([] {});
        }
    }
};

Task<void> neverEnds(std::shared_ptr<int> content, Queue queue, Events* begun)
{
    const Frame frame{std::move(content), std::move(queue)};
    auto never = awaitCompletion<void>([begun](const std::function<void()>&) { begun->happen(); });
    co_await never;
}

TYPED_TEST(WorkQueuesTest, workThatIsLeftAtTheEndIsFreed)
{
    const auto content = std::make_shared<int>(1);
    Events begun;
    const Queue queue = this->serialQueue("a");
    const Queue caller = this->serialQueue("b");
    caller->async([] {});
    queue->async(neverEnds(content, queue, &begun));
    queue->async(neverEnds(content, caller, &begun));
    caller->async(performOn(queue));
    this->queues().concurrentQueue(Priority::background).async(neverEnds(content, queue, &begun));
    ASSERT_TRUE(this->waitFor(begun, 2));
    EXPECT_GT(content.use_count(), 3);
    this->harness.shutDown();
    EXPECT_EQ(content.use_count(), 1);
}

}  // namespace

}  // namespace typhon::test
