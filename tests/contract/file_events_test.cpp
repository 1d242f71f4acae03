#include "platform/linux/event_pool.h"
#include "platform/linux/linux_clock.h"
#include "platform/linux/linux_file_events.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_clock.h"
#include "platform/simulated/simulated_file_events.h"
#include "platform/simulated/simulated_log.h"
#include "platform/simulated/simulated_work_queues.h"

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <functional>
#include <list>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;
using Paths = std::vector<std::string>;

constexpr auto latency = 50ms;

/// The batches that a stream delivered.
class Received {
public:
    struct Batch {
        Paths paths;
        std::string queue;
        std::chrono::nanoseconds time;
    };

    void add(Batch batch)
    {
        const std::lock_guard lock(mutex_);
        batches_.push_back(std::move(batch));
        changed_.notify_all();
    }
    bool waitFor(std::size_t count)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, 60s, [&] { return batches_.size() >= count; });
    }
    std::vector<Batch> batches() const
    {
        const std::lock_guard lock(mutex_);
        return batches_;
    }
    /// Of the batch with that number.
    Paths paths(std::size_t number) const { return batches().at(number).paths; }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<Batch> batches_;
};

/// File events of one system, and its files.
class Subject {
public:
    virtual ~Subject() = default;
    virtual WorkQueues& queues() = 0;
    virtual Clock& clock() = 0;
    virtual FileEvents& events() = 0;
    /// Makes or changes a file, with the directories above it.
    virtual void write(const std::string& path) = 0;
    /// Lets what was started go on; streams watch when it returns.
    virtual void settle(WorkQueue& queue) = 0;
    virtual bool waitFor(Received& received, std::size_t batches) = 0;
};

class SimulatedSubject final : public Subject {
public:
    WorkQueues& queues() override { return queues_; }
    Clock& clock() override { return clock_; }
    FileEvents& events() override { return events_; }
    void write(const std::string& path) override { events_.change(path); }
    void settle(WorkQueue& /*queue*/) override { scheduler_.runUntilIdle(); }
    bool waitFor(Received& received, std::size_t batches) override
    {
        return scheduler_.runUntil([&] { return received.batches().size() >= batches; });
    }

private:
    SimulatedScheduler scheduler_{1};
    SimulatedWorkQueues queues_{scheduler_};
    SimulatedClock clock_{scheduler_};
    SimulatedFileEvents events_{scheduler_};
};

class LinuxSubject final : public Subject {
public:
    ~LinuxSubject() override { pool_.stop(); }
    WorkQueues& queues() override { return queues_; }
    Clock& clock() override { return clock_; }
    FileEvents& events() override { return events_; }
    void write(const std::string& path) override { scratch_.writeFile(path, "changed"); }
    void settle(WorkQueue& queue) override
    {
        queue.sync([] {});
    }
    bool waitFor(Received& received, std::size_t batches) override { return received.waitFor(batches); }

private:
    ScratchDirectory scratch_;
    SimulatedLog log_;
    EventPool pool_;
    LinuxWorkQueues queues_{pool_};
    LinuxClock clock_;
    LinuxFileEvents events_{pool_, queues_, log_, RootDirectory(scratch_.path())};
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class FileEventsContract : public testing::TestWithParam<Implementation> {
protected:
    ~FileEventsContract() override
    {
        streams.clear();
        queue->sync([] {});
        subject.reset();
    }
    std::shared_ptr<FileEventStream> create(Paths paths, Received& received)
    {
        auto stream = subject->events().createStream(std::move(paths), latency, [this, &received](Paths all) {
            received.add({std::move(all), WorkItem::current()->queue.label(), subject->clock().uptime()});
        });
        stream->setDispatchQueue(queue);
        streams.push_back(stream);
        return stream;
    }
    void start(Paths paths, Received& received)
    {
        create(std::move(paths), received)->start();
        subject->settle(*queue);
    }
    /// Changes files at a time when nobody looks, so that no batch ends in between.
    void change(const Paths& paths)
    {
        queue->sync([&] {
            for (const auto& path : paths) {
                subject->write(path);
            }
        });
    }

    Received first;
    Received second;
    std::unique_ptr<Subject> subject = GetParam().make();
    std::shared_ptr<WorkQueue> queue = subject->queues().createSerialQueue("the stream's queue");
    std::vector<std::shared_ptr<FileEventStream>> streams;
};

TEST_P(FileEventsContract, AChangedFileIsReportedByItsPathOnTheStreamsQueue)
{
    subject->write("/store/a/old");
    start({"/store/"}, first);
    change({"/store/a/old"});
    ASSERT_TRUE(subject->waitFor(first, 1));
    EXPECT_EQ(first.paths(0), Paths{"/store/a/old"});
    EXPECT_EQ(first.batches().front().queue, "the stream's queue");
}

TEST_P(FileEventsContract, WhatWasThereBeforeTheStartIsNotReported)
{
    const auto stream = create({"/store"}, first);
    subject->write("/store/a/old");
    stream->start();
    subject->settle(*queue);
    change({"/store/a/new"});
    ASSERT_TRUE(subject->waitFor(first, 1));
    EXPECT_EQ(first.paths(0), Paths{"/store/a/new"});
}

TEST_P(FileEventsContract, ABatchIsSortedAndHasEachPathOnce)
{
    subject->write("/store/a/old");
    start({"/store"}, first);
    change({"/store/a/b", "/store/a/c", "/store/a/b", "/store/a/a", "/store/a/c"});
    ASSERT_TRUE(subject->waitFor(first, 1));
    EXPECT_EQ(first.paths(0), (Paths{"/store/a/a", "/store/a/b", "/store/a/c"}));
}

TEST_P(FileEventsContract, ABatchComesNoSoonerThanTheLatencyAfterItsFirstChange)
{
    subject->write("/store/a/old");
    start({"/store"}, first);
    const auto before = subject->clock().uptime();
    change({"/store/a/new"});
    ASSERT_TRUE(subject->waitFor(first, 1));
    EXPECT_GE(first.batches().front().time - before, latency);
}

TEST_P(FileEventsContract, WhatChangesAfterABatchIsInTheNext)
{
    subject->write("/store/a/old");
    start({"/store"}, first);
    change({"/store/a/new"});
    ASSERT_TRUE(subject->waitFor(first, 1));
    change({"/store/a/newer"});
    ASSERT_TRUE(subject->waitFor(first, 2));
    EXPECT_EQ(first.paths(1), Paths{"/store/a/newer"});
}

TEST_P(FileEventsContract, OnlyWhatLiesBelowTheDirectoriesIsReported)
{
    for (const char* path : {"/store/a/old", "/store2/a/old", "/other/a/old"}) {
        subject->write(path);
    }
    start({"/store", "/other/"}, first);
    change({"/store2/a/new", "/elsewhere", "/other2", "/other/a/new", "/store/a/new"});
    ASSERT_TRUE(subject->waitFor(first, 1));
    EXPECT_EQ(first.paths(0), (Paths{"/other/a/new", "/store/a/new"}));
}

TEST_P(FileEventsContract, EveryStreamHasItsOwnBatches)
{
    subject->write("/store/a/old");
    subject->write("/store/b/old");
    start({"/store"}, first);
    start({"/store/b"}, second);
    change({"/store/a/new", "/store/b/new"});
    ASSERT_TRUE(subject->waitFor(first, 1));
    ASSERT_TRUE(subject->waitFor(second, 1));
    EXPECT_EQ(first.paths(0), (Paths{"/store/a/new", "/store/b/new"}));
    EXPECT_EQ(second.paths(0), Paths{"/store/b/new"});
}

TEST_P(FileEventsContract, ASecondStartChangesNothing)
{
    subject->write("/store/a/old");
    start({"/store"}, first);
    streams.front()->start();
    subject->settle(*queue);
    change({"/store/a/new"});
    ASSERT_TRUE(subject->waitFor(first, 1));
    change({"/store/a/newer"});
    ASSERT_TRUE(subject->waitFor(first, 2));
    EXPECT_EQ(first.paths(0), Paths{"/store/a/new"});
    EXPECT_EQ(first.paths(1), Paths{"/store/a/newer"});
}

TEST_P(FileEventsContract, AStreamThatIsDroppedEndsEvenWithABatchUnderWay)
{
    subject->write("/store/a/old");
    start({"/store"}, second);
    std::list<Received> dropped;
    std::size_t batches = 0;
    // Anew where it is dropped so late that its batch may have come before.
    for (std::chrono::nanoseconds taken = latency; taken >= latency;) {
        start({"/store"}, dropped.emplace_back());
        batches = second.batches().size();
        const auto before = subject->clock().uptime();
        change({"/store/a/new"});
        queue->sync([&] { streams.pop_back(); });
        taken = subject->clock().uptime() - before;
    }
    ASSERT_TRUE(subject->waitFor(second, batches + 1));
    change({"/store/a/newer"});
    ASSERT_TRUE(subject->waitFor(second, batches + 2));
    EXPECT_TRUE(dropped.back().batches().empty());
}

INSTANTIATE_TEST_SUITE_P(, FileEventsContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
