#include "platform/linux/directory_watch.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/scratch_directory.h"

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <functional>
#include <mutex>
#include <optional>

#include <fcntl.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using Paths = std::vector<std::string>;
using Outcome = DirectoryWatch::Outcome;

class DirectoryWatchTest : public ::testing::Test {
protected:
    ~DirectoryWatchTest() override { pool.stop(); }

    std::shared_ptr<DirectoryWatch> newWatch()
    {
        return std::make_shared<DirectoryWatch>(pool, queues, queue, batchTime,
                                                [this](DirectoryWatch::Batch batch) {
                                                    const std::lock_guard lock(mutex);
                                                    batches.push_back(std::move(batch));
                                                    changed.notify_all();
                                                });
    }
    /// Watches a directory of the scratch folder under its own name.
    Outcome add(const std::string& name, const std::string& onlyName = {})
    {
        std::optional<Outcome> outcome;
        queue->sync([&] {
            const FileDescriptor directory(::open((scratch.path() + name).c_str(), O_RDONLY | O_DIRECTORY));
            outcome = watch->watch(name, directory.get(), onlyName);
        });
        return *outcome;
    }
    /// The next batch; an empty one when none comes for long.
    DirectoryWatch::Batch next()
    {
        std::unique_lock lock(mutex);
        if (!changed.wait_for(lock, std::chrono::seconds(60), [this] { return !batches.empty(); })) {
            return {};
        }
        auto batch = std::move(batches.front());
        batches.erase(batches.begin());
        return batch;
    }
    void forgetBatches()
    {
        const std::lock_guard lock(mutex);
        batches.clear();
    }
    /// Holds the queue meanwhile, so that all of it is there when the watch looks, however long that takes.
    void whileNothingIsRead(const std::function<void()>& change) { queue->sync(change); }
    void make(const std::string& name) const { std::filesystem::create_directory(scratch.path() + name); }

    void makeWatched(const std::string& name)
    {
        make(name);
        add(name);
    }

    static constexpr std::chrono::milliseconds batchTime{50};

    ScratchDirectory scratch;
    std::mutex mutex;
    std::condition_variable changed;
    std::vector<DirectoryWatch::Batch> batches;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    const std::shared_ptr<WorkQueue> queue = queues.createSerialQueue("watch");
    std::shared_ptr<DirectoryWatch> watch = newWatch();
};

TEST_F(DirectoryWatchTest, ABurstOfChangesIsOneBatch)
{
    make("/a");
    EXPECT_EQ(add("/a"), Outcome::added);
    whileNothingIsRead([&] {
        scratch.writeFile("/a/one", "1");
        scratch.writeFile("/a/two", "2");
        std::filesystem::remove(scratch.real("/a/one"));
    });
    const auto batch = next();
    EXPECT_EQ(batch.paths, (Paths{"/a/one", "/a/two"}));
    EXPECT_FALSE(batch.mustRescan);
}

TEST_F(DirectoryWatchTest, WatchingAgainIsNothingNew)
{
    make("/a");
    EXPECT_EQ(add("/a"), Outcome::added);
    EXPECT_EQ(add("/a"), Outcome::known);
    EXPECT_EQ(add("/a", "one"), Outcome::known);
}

TEST_F(DirectoryWatchTest, OnlyTheNamesAskedForAreReported)
{
    make("/a");
    EXPECT_EQ(add("/a", "one"), Outcome::added);
    EXPECT_EQ(add("/a", "two"), Outcome::added);
    EXPECT_EQ(add("/a", "two"), Outcome::known);
    scratch.writeFile("/a/other", "");
    scratch.writeFile("/a/two", "");
    EXPECT_EQ(next().paths, Paths{"/a/two"});
}

TEST_F(DirectoryWatchTest, AllNamesTakeThePlaceOfSome)
{
    make("/a");
    add("/a", "one");
    EXPECT_EQ(add("/a"), Outcome::added);
    scratch.writeFile("/a/other", "");
    EXPECT_EQ(next().paths, Paths{"/a/other"});
}

TEST_F(DirectoryWatchTest, ADirectoryThatGoesAwayAsksForARescan)
{
    make("/a");
    add("/a");
    std::filesystem::remove(scratch.real("/a"));
    EXPECT_TRUE(next().mustRescan);
    make("/a");
    EXPECT_EQ(add("/a"), Outcome::added);
}

TEST_F(DirectoryWatchTest, ADirectoryThatIsMovedAwayReportsNoMore)
{
    makeWatched("/a");
    makeWatched("/b");
    std::filesystem::rename(scratch.real("/a"), scratch.real("/away"));
    EXPECT_TRUE(next().mustRescan);
    scratch.writeFile("/away/one", "");
    scratch.writeFile("/b/two", "");
    EXPECT_EQ(next().paths, Paths{"/b/two"});
}

TEST_F(DirectoryWatchTest, AnotherDirectoryAtThePathTakesTheOldOnesPlace)
{
    make("/a");
    make("/b");
    add("/a");
    queue->sync([this] {
        const FileDescriptor other(::open(scratch.real("/b").c_str(), O_RDONLY | O_DIRECTORY));
        EXPECT_EQ(watch->watch("/a", other.get()), Outcome::added);
    });
    scratch.writeFile("/a/old", "");
    scratch.writeFile("/b/new", "");
    EXPECT_EQ(next().paths, Paths{"/a/new"});
}

TEST_F(DirectoryWatchTest, UnwantedWatchesEnd)
{
    makeWatched("/a");
    makeWatched("/b");
    queue->sync([this] { watch->keepOnly({"/b"}); });
    scratch.writeFile("/a/one", "");
    scratch.writeFile("/b/two", "");
    EXPECT_EQ(next().paths, Paths{"/b/two"});
}

TEST_F(DirectoryWatchTest, TooManyChangesAskForARescan)
{
    make("/a");
    add("/a");
    whileNothingIsRead([&] {
        for (int number = 0; number < 5000; ++number) {
            scratch.writeFile("/a/" + std::to_string(number), "");
        }
    });
    const auto batch = next();
    EXPECT_TRUE(batch.mustRescan);
    EXPECT_LE(batch.paths.size(), 4096u);
}

TEST_F(DirectoryWatchTest, WhatIsNoDirectoryCannotBeWatched)
{
    scratch.writeFile("/file", "");
    queue->sync([this] {
        const FileDescriptor file(::open(scratch.real("/file").c_str(), O_RDONLY));
        EXPECT_EQ(watch->watch("/file", file.get()), Outcome::failed);
    });
}

TEST_F(DirectoryWatchTest, ADroppedWatchReportsNothing)
{
    make("/a");
    // Anew where it is dropped so late that its batch may have come before.
    for (std::chrono::nanoseconds taken = batchTime; taken >= batchTime;) {
        watch = newWatch();
        add("/a");
        const auto begin = std::chrono::steady_clock::now();
        scratch.writeFile("/a/one", "");
        queue->sync([this] { watch.reset(); });
        taken = std::chrono::steady_clock::now() - begin;
    }
    forgetBatches();
    // Its first batch comes after that of the dropped one would.
    watch = newWatch();
    make("/b");
    add("/b");
    scratch.writeFile("/b/two", "");
    EXPECT_EQ(next().paths, Paths{"/b/two"});
}

}  // namespace
}  // namespace typhon
