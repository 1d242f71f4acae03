#include "platform/linux/linux_file_events.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/scratch_directory.h"

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <set>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;

const std::string store = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";

class LinuxFileEventsTest : public testing::Test {
protected:
    ~LinuxFileEventsTest() override
    {
        stream.reset();
        pool.stop();
    }

    /// Starts the stream, and returns when it watches.
    void start()
    {
        stream = events.createStream({store}, 20ms, [this](std::vector<std::string> paths) {
            const std::lock_guard lock(mutex);
            ++batches;
            reported.insert(paths.begin(), paths.end());
            changed.notify_all();
        });
        stream->setDispatchQueue(queue);
        stream->start();
        queue->sync([] {});
    }
    /// Waits until that path was reported; false when it never was.
    bool waitFor(const std::string& path)
    {
        std::unique_lock lock(mutex);
        return changed.wait_for(lock, 20s, [&] { return reported.contains(path); });
    }
    /// True when that path or the whole store was reported.
    bool waitForAnyOf(const std::string& path, const std::string& other)
    {
        std::unique_lock lock(mutex);
        return changed.wait_for(lock, 20s,
                                [&] { return reported.contains(path) || reported.contains(other); });
    }
    void forget()
    {
        const std::lock_guard lock(mutex);
        reported.clear();
        batches = 0;
    }
    /// Makes more events in a watched directory than the kernel keeps, on as few files as do not count as
    /// one.
    void makeTooManyEvents(const std::string& directory)
    {
        unsigned kept = 0;
        std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> kept;
        ASSERT_GT(kept, 0U);
        for (unsigned event = 0; event <= kept; ++event) {
            const auto path = scratch.real(directory + (event % 2 == 0 ? "even" : "odd"));
            ::close(::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644));
        }
    }
    static std::string whole() { return store.substr(0, store.size() - 1); }

    ScratchDirectory scratch;
    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    EventPool pool;
    LinuxWorkQueues queues{pool};
    LinuxFileEvents events{pool, queues, log, RootDirectory(scratch.path())};
    std::shared_ptr<WorkQueue> queue = queues.createSerialQueue("events");
    std::mutex mutex;
    std::condition_variable changed;
    std::set<std::string> reported;
    unsigned batches = 0;
    std::shared_ptr<FileEventStream> stream;
};

TEST_F(LinuxFileEventsTest, WhatWasThereBeforeIsNotReported)
{
    scratch.writeFile(store + "a.asset/AssetData/old.ttf", "old");
    start();
    scratch.writeFile(store + "a.asset/AssetData/new.ttf", "new");
    ASSERT_TRUE(waitFor(store + "a.asset/AssetData/new.ttf"));
    const std::lock_guard lock(mutex);
    EXPECT_FALSE(reported.contains(store + "a.asset/AssetData/old.ttf"));
}

TEST_F(LinuxFileEventsTest, FilesInNestedNewDirectoriesAreReported)
{
    fs::create_directories(scratch.real(store));
    start();
    for (int asset = 0; asset < 200; ++asset) {
        scratch.writeFile(store + std::to_string(asset) + ".asset/AssetData/deep/font.ttf", "font");
    }
    for (int asset = 0; asset < 200; ++asset) {
        ASSERT_TRUE(waitForAnyOf(store + std::to_string(asset) + ".asset/AssetData/deep/font.ttf", whole()))
            << asset;
    }
}

TEST_F(LinuxFileEventsTest, AStoreThatIsMissingAtTheStartIsFollowedWhenItComes)
{
    start();
    scratch.writeFile(store + "a.asset/AssetData/a.ttf", "font");
    ASSERT_TRUE(waitForAnyOf(store + "a.asset/AssetData/a.ttf", whole()));
    forget();
    scratch.writeFile(store + "a.asset/AssetData/b.ttf", "font");
    EXPECT_TRUE(waitForAnyOf(store + "a.asset/AssetData/b.ttf", whole()));
}

TEST_F(LinuxFileEventsTest, AStoreThatIsRemovedAndMadeAnewIsFollowedOn)
{
    scratch.writeFile(store + "a.asset/AssetData/a.ttf", "font");
    start();
    fs::remove_all(scratch.real("/private"));
    ASSERT_TRUE(waitFor(whole()));
    forget();
    scratch.writeFile(store + "b.asset/AssetData/b.ttf", "font");
    ASSERT_TRUE(waitForAnyOf(store + "b.asset/AssetData/b.ttf", whole()));
    forget();
    scratch.writeFile(store + "b.asset/AssetData/c.ttf", "font");
    EXPECT_TRUE(waitForAnyOf(store + "b.asset/AssetData/c.ttf", whole()));
}

TEST_F(LinuxFileEventsTest, ADirectoryThatIsMovedOutIsNotFollowedAndOneThatIsMovedInIs)
{
    scratch.writeFile(store + "a.asset/AssetData/a.ttf", "font");
    scratch.writeFile("/elsewhere/b.asset/AssetData/b.ttf", "font");
    start();
    fs::rename(scratch.real(store + "a.asset"), scratch.real("/elsewhere/a.asset"));
    ASSERT_TRUE(waitForAnyOf(store + "a.asset", whole()));
    fs::rename(scratch.real("/elsewhere/b.asset"), scratch.real(store + "b.asset"));
    ASSERT_TRUE(waitForAnyOf(store + "b.asset/AssetData/b.ttf", whole()));
    forget();
    scratch.writeFile("/elsewhere/a.asset/AssetData/unseen.ttf", "font");
    scratch.writeFile(store + "b.asset/AssetData/seen.ttf", "font");
    ASSERT_TRUE(waitForAnyOf(store + "b.asset/AssetData/seen.ttf", whole()));
    const std::lock_guard lock(mutex);
    for (const auto& path : reported) {
        EXPECT_EQ(path.find("unseen"), std::string::npos) << path;
    }
}

TEST_F(LinuxFileEventsTest, WhenEventsAreLostTheWholeIsReportedAndWatchedAnew)
{
    scratch.writeFile(store + "a.asset/AssetData/a.ttf", "font");
    start();
    queue->sync([&] {
        makeTooManyEvents(store + "a.asset/AssetData/");
        // Nobody is told of these: only who looks again finds them.
        scratch.writeFile(store + "late.asset/AssetData/late.ttf", "font");
    });
    ASSERT_TRUE(waitFor(whole()));
    forget();
    scratch.writeFile(store + "late.asset/AssetData/later.ttf", "font");
    EXPECT_TRUE(waitFor(store + "late.asset/AssetData/later.ttf"));
}

TEST_F(LinuxFileEventsTest, AnotherDirectoryInPlaceOfOneAboveTheStoreIsFollowed)
{
    scratch.writeFile(store + "a.asset/AssetData/a.ttf", "font");
    scratch.writeFile("/elsewhere" + store + "b.asset/AssetData/b.ttf", "font");
    start();
    fs::rename(scratch.real("/private"), scratch.real("/away"));
    fs::rename(scratch.real("/elsewhere/private"), scratch.real("/private"));
    ASSERT_TRUE(waitForAnyOf(store + "b.asset/AssetData/b.ttf", whole()));
    forget();
    scratch.writeFile("/away" + store.substr(8) + "a.asset/AssetData/unseen.ttf", "font");
    scratch.writeFile(store + "b.asset/AssetData/seen.ttf", "font");
    ASSERT_TRUE(waitForAnyOf(store + "b.asset/AssetData/seen.ttf", whole()));
    const std::lock_guard lock(mutex);
    EXPECT_FALSE(reported.contains(store + "a.asset/AssetData/unseen.ttf"));
}

TEST_F(LinuxFileEventsTest, RemovalsAndReplacementsAreReported)
{
    scratch.writeFile(store + "a.asset/AssetData/a.ttf", "font");
    scratch.writeFile(store + "a.asset/AssetData/b.ttf", "font");
    start();
    fs::remove(scratch.real(store + "a.asset/AssetData/a.ttf"));
    ASSERT_TRUE(waitFor(store + "a.asset/AssetData/a.ttf"));
    scratch.writeFile("/elsewhere/b.ttf", "other");
    fs::rename(scratch.real("/elsewhere/b.ttf"), scratch.real(store + "a.asset/AssetData/b.ttf"));
    EXPECT_TRUE(waitFor(store + "a.asset/AssetData/b.ttf"));
}

}  // namespace
}  // namespace typhon
