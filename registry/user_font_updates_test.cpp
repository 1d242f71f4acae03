#include "platform/simulated/simulated_platform.h"
#include "registry/user_font_registry.h"
#include "registry/user_font_updates.h"

#include <algorithm>

#include <gtest/gtest.h>

namespace typhon {
namespace {

const std::string registryPath = UserFontRegistry::path;

class UserFontUpdatesTest : public testing::Test {
protected:
    /// Has a client of its own queue call `updatingUserFonts:`.
    void callFromClient(const std::string& name)
    {
        auto queue = simulated.queues.createSerialQueue(name);
        queue->async(updates.updatingUserFonts([this, name] { events.push_back(name); }));
        clientQueues.push_back(queue);
    }

    SimulatedPlatform simulated;
    UserFontUpdates updates{simulated.platform.processWideQueues};
    UserFontRegistry registry{simulated.fileSystem, simulated.log, updates};
    std::vector<std::shared_ptr<WorkQueue>> clientQueues;
    std::vector<std::string> events;
};

TEST_F(UserFontUpdatesTest, TwoClientsCallingAtOnceAreEachAnsweredOnce)
{
    callFromClient("one");
    callFromClient("two");
    EXPECT_TRUE(events.empty());
    simulated.drain();
    std::ranges::sort(events);
    EXPECT_EQ(events, (std::vector<std::string>{"one", "two"}));
}

TEST_F(UserFontUpdatesTest, AClientThatCallsWhileTheRegistryIsReadIsAnsweredAfterwards)
{
    simulated.fileSystem.addFile(registryPath, PropertyList());
    simulated.fileSystem.setDuringRead([&](const std::string&) {
        callFromClient("client answered");
        events.emplace_back("still reading");
    });
    auto reader = simulated.queues.createSerialQueue("reader");
    reader->async([this] {
        registry._userFontsInfoFromDisk();
        events.emplace_back("registry read");
    });
    simulated.drain();
    ASSERT_EQ(events.size(), 3U);
    EXPECT_EQ(events[0], "still reading");
    EXPECT_TRUE(std::ranges::find(events, "client answered") != events.end());
}

TEST_F(UserFontUpdatesTest, NoReadStartsWhileAClientIsBeingAnswered)
{
    simulated.fileSystem.addFile(registryPath, PropertyList());
    auto reader = simulated.queues.createSerialQueue("reader");
    auto client = simulated.queues.createSerialQueue("client");
    std::size_t readsDuringAnswer = 0;
    client->async(updates.updatingUserFonts([&] {
        reader->async([this] { registry._userFontsInfoFromDisk(); });
        readsDuringAnswer = simulated.fileSystem.reads();
        events.emplace_back(WorkItem::current()->queue.label());
    }));
    simulated.drain();
    EXPECT_EQ(readsDuringAnswer, 0U);
    EXPECT_EQ(simulated.fileSystem.reads(), 1U);
    EXPECT_EQ(events, std::vector<std::string>{"com.vorlan.typhon.UpdatingUserFonts"});
}

TEST_F(UserFontUpdatesTest, TheRegistryIsReadOnTheUpdatingQueueOnly)
{
    simulated.fileSystem.addFile(registryPath, PropertyList());
    simulated.fileSystem.setDuringRead(
        [&](const std::string&) { events.push_back(WorkItem::current()->queue.label()); });
    registry.isUserFontInstalled();
    EXPECT_EQ(events, std::vector<std::string>{"com.vorlan.typhon.UpdatingUserFonts"});
}

TEST_F(UserFontUpdatesTest, TheQueueBelongsToTheProcessNotToOneDaemon)
{
    UserFontUpdates other(simulated.platform.processWideQueues);
    WorkQueue* first = nullptr;
    WorkQueue* second = nullptr;
    updates.updatingUserFontsAndWait([&] { first = &WorkItem::current()->queue; });
    other.updatingUserFontsAndWait([&] { second = &WorkItem::current()->queue; });
    EXPECT_NE(first, nullptr);
    EXPECT_EQ(first, second);
}

TEST_F(UserFontUpdatesTest, AnsweringChangesNeitherPreferencesNorRegistry)
{
    callFromClient("client");
    simulated.drain();
    EXPECT_EQ(events, std::vector<std::string>{"client"});
    EXPECT_EQ(simulated.preferences.writes(), 0U);
    EXPECT_EQ(simulated.fileSystem.reads(), 0U);
    EXPECT_EQ(registry.userFontsInfo(), nullptr);
}

}  // namespace
}  // namespace typhon
