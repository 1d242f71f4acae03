#include "lifecycle/application_removal.h"
#include "platform/simulated/simulated_platform.h"
#include "registry/user_font_registry.h"
#include "registry/user_font_updates.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;
using Calls = std::vector<std::string>;

constexpr const char* unregistered = "com.vorlan.Startwell.applicationUnregistered";

/// A device with two providers' fonts and two clients' records.
class ApplicationRemovalTest : public testing::Test {
protected:
    ApplicationRemovalTest()
    {
        Dictionary fonts;
        for (const char* provider : {"com.example.foundry", "com.example.suite"}) {
            fonts.emplace(std::string("/var/mobile/Library/UserFonts/FontFiles/") + provider + "/a.ttf",
                          Dictionary{{"familyName", Dictionary{{"Alpha", "Alpha"}}}});
        }
        simulated.fileSystem.addFile(UserFontRegistry::path, fonts);
        simulated.preferences.changeFromOutside(
            "issues",
            PropertyList(Dictionary{{"com.example.reader", Array{}}, {"com.example.writer", Array{}}}));
    }

    void announce(PropertyList event)
    {
        simulated.notifications.deliver(event_streams::distributed, std::move(event));
    }
    void announceRemoval(PropertyList bundleIDs)
    {
        announce(Dictionary{{event_streams::eventName, unregistered},
                            {event_streams::userInfo, Dictionary{{"bundleIDs", std::move(bundleIDs)}}}});
    }
    void install(const std::string& identifier, bool isPlaceholder = false)
    {
        simulated.applicationRegistry.install(
            {.bundleIdentifier = identifier, .shortVersionString = "1", .isPlaceholder = isPlaceholder});
    }
    void sweep()
    {
        simulated.run(detail::callAsTask(std::function<void()>([this] { removal->sweepStrayEntries(); })));
    }
    const Calls& calls() const { return simulated.userFontManager.calls(); }
    bool hasRecord(const std::string& identifier)
    {
        return simulated.preferences.dictionary("issues").contains(identifier);
    }
    bool hasLogged(LogLevel level, const std::string& message) const
    {
        return simulated.log.contains(LogSink::daemon, level, message);
    }
    static std::string unregistering(const std::string& identifier)
    {
        return "unregisterAndRemoveFontFilesForIdentifier " + identifier;
    }

    SimulatedPlatform simulated;
    UserFontUpdates updates{simulated.platform.processWideQueues};
    UserFontRegistry registry{simulated.fileSystem, simulated.log, updates};
    IssuedPathsLedger ledger{simulated.preferences, simulated.codeSigning, registry};
    std::shared_ptr<WorkQueue> mainHandlerQueue = simulated.queues.createSerialQueue("com.vorlan.typhond");
    std::shared_ptr<ApplicationRemoval> removal =
        std::make_shared<ApplicationRemoval>(simulated.platform, ledger, *mainHandlerQueue);
    const std::string synchronizing = "synchronizeFontProviders";
};

class RemovalEvent : public ApplicationRemovalTest {
protected:
    RemovalEvent() { removal->setupForDistributedNotifications(); }
};

TEST_F(RemovalEvent, ARemovedApplicationsFontsAndRecordGo)
{
    announceRemoval(Array{"com.example.foundry", "com.example.reader"});
    simulated.drain();
    EXPECT_EQ(calls(), (Calls{unregistering("com.example.foundry"), unregistering("com.example.reader"),
                              synchronizing}));
    EXPECT_EQ(simulated.userFontManager.knownFontProviders(), Calls{"com.example.suite"});
    EXPECT_FALSE(hasRecord("com.example.reader"));
    EXPECT_TRUE(hasRecord("com.example.writer"));
    EXPECT_TRUE(hasLogged(LogLevel::defaultLevel, "synchroning FontProviders"));
}

TEST_F(RemovalEvent, WithoutIdentifiersOnlyTheProvidersAreSynchronised)
{
    announce(Dictionary{{event_streams::eventName, unregistered}, {event_streams::userInfo, Dictionary{}}});
    simulated.drain();
    EXPECT_EQ(calls(), Calls{synchronizing});
    announceRemoval(Array{});
    simulated.drain();
    EXPECT_EQ(calls(), (Calls{synchronizing, synchronizing}));
}

TEST_F(RemovalEvent, EventsOfOtherNamesOrWithoutADictionaryAreIgnoredInSilence)
{
    const Dictionary userInfo{{"bundleIDs", Array{"com.example.foundry"}}};
    announce(Dictionary{{event_streams::userInfo, userInfo}});
    announce(Dictionary{{event_streams::eventName, 7}, {event_streams::userInfo, userInfo}});
    for (const char* name :
         {"", "com.vorlan.Startwell.applicationRegistered", "com.vorlan.Startwell.ApplicationUnregistered",
          "com.vorlan.Startwell.applicationUnregistered2"}) {
        announce(Dictionary{{event_streams::eventName, name}, {event_streams::userInfo, userInfo}});
    }
    announce(Dictionary{{event_streams::eventName, unregistered}});
    announce(
        Dictionary{{event_streams::eventName, unregistered}, {event_streams::userInfo, Array{userInfo}}});
    announce(Dictionary{{event_streams::eventName, unregistered}, {event_streams::userInfo, "bundleIDs"}});
    announce("com.vorlan.Startwell.applicationUnregistered");
    simulated.drain();
    EXPECT_EQ(calls(), Calls{});
    EXPECT_TRUE(simulated.log.entries().empty());
}

TEST_F(RemovalEvent, IdentifiersOfWrongTypesAreTolerated)
{
    announceRemoval("com.example.foundry");
    announceRemoval(Dictionary{{"com.example.foundry", true}});
    announceRemoval(7);
    announceRemoval(Array{1, Array{"com.example.foundry"}, "com.example.suite", true});
    simulated.drain();
    EXPECT_EQ(calls(), (Calls{synchronizing, synchronizing, synchronizing, unregistering("com.example.suite"),
                              synchronizing}));
}

TEST_F(RemovalEvent, UnregisteringsAreStrictlySequential)
{
    simulated.userFontManager.holdOperations();
    announceRemoval(Array{"a", "b", "c"});
    Calls expected;
    for (const char* identifier : {"a", "b", "c"}) {
        simulated.drain();
        expected.push_back(unregistering(identifier));
        EXPECT_EQ(calls(), expected);
        ASSERT_TRUE(simulated.userFontManager.finishNext());
    }
    simulated.drain();
    expected.push_back(synchronizing);
    EXPECT_EQ(calls(), expected);
}

TEST_F(RemovalEvent, TheMainQueueIsHeldUntilTheEventIsDealtWith)
{
    simulated.userFontManager.holdOperations();
    announceRemoval(Array{"a"});
    simulated.drain();
    bool hasRun = false;
    simulated.queues.mainQueue().async([&] { hasRun = true; });
    announceRemoval(Array{"b"});
    simulated.drain();
    EXPECT_FALSE(hasRun);
    EXPECT_EQ(calls(), Calls{unregistering("a")});
    simulated.userFontManager.finishNext();
    simulated.drain();
    EXPECT_TRUE(hasRun);
    EXPECT_EQ(calls(), (Calls{unregistering("a"), synchronizing, unregistering("b")}));
}

TEST_F(RemovalEvent, TheRecordIsForgottenOnTheMainHandlerQueueAndNotAwaited)
{
    const auto gate = simulated.queues.createSemaphore(0);
    const auto hold = [](std::shared_ptr<Semaphore> until) -> Task<void> { return until->wait(); };
    mainHandlerQueue->async(hold(gate));
    announceRemoval(Array{"com.example.reader", "com.example.foundry"});
    simulated.drain();
    EXPECT_EQ(calls().size(), 3U);
    EXPECT_TRUE(hasRecord("com.example.reader"));
    gate->signal();
    simulated.drain();
    EXPECT_FALSE(hasRecord("com.example.reader"));
}

TEST_F(RemovalEvent, AFailureIsLoggedAndTheRecordForgottenAllTheSame)
{
    simulated.userFontManager.failNext("the disk is full");
    announceRemoval(Array{"com.example.reader"});
    simulated.drain();
    EXPECT_TRUE(hasLogged(LogLevel::debug, "unregistering com.example.reader error - the disk is full"));
    EXPECT_FALSE(hasRecord("com.example.reader"));
    EXPECT_EQ(calls(), (Calls{unregistering("com.example.reader"), synchronizing})) << "not tried again";
}

TEST_F(RemovalEvent, AnAnnouncedRemovalIsBelievedEvenOfAnInstalledApplication)
{
    install("com.example.foundry");
    announceRemoval(Array{"com.example.foundry"});
    simulated.drain();
    EXPECT_EQ(simulated.userFontManager.knownFontProviders(), Calls{"com.example.suite"});
}

class StrayEntrySweep : public ApplicationRemovalTest {};

TEST_F(StrayEntrySweep, NothingIsTakenFromInstalledApplications)
{
    for (const char* identifier :
         {"com.example.foundry", "com.example.suite", "com.example.reader", "com.example.writer"}) {
        install(identifier);
    }
    sweep();
    EXPECT_EQ(calls(), Calls{});
    EXPECT_EQ(simulated.preferences.writes(), 0U);
    EXPECT_TRUE(simulated.log.entries().empty());
}

TEST_F(StrayEntrySweep, AStrayProvidersFontsGoAndTheProvidersAreNotSynchronised)
{
    for (const char* identifier : {"com.example.suite", "com.example.reader", "com.example.writer"}) {
        install(identifier);
    }
    sweep();
    EXPECT_EQ(calls(), Calls{unregistering("com.example.foundry")});
    EXPECT_TRUE(hasLogged(LogLevel::debug, "stray provider \"com.example.foundry\" detected"));
    EXPECT_EQ(simulated.userFontManager.knownFontProviders(), Calls{"com.example.suite"});
    EXPECT_EQ(simulated.log.entries().size(), 1U) << "success is silent";
}

TEST_F(StrayEntrySweep, AnApplicationThatIsAPlaceholderOnlyIsStray)
{
    install("com.example.foundry", true);
    install("com.example.reader", true);
    install("com.example.suite");
    install("com.example.writer");
    sweep();
    EXPECT_EQ(calls(), Calls{unregistering("com.example.foundry")});
    EXPECT_FALSE(hasRecord("com.example.reader"));
}

TEST_F(StrayEntrySweep, AStrayClientIsForgotten)
{
    for (const char* identifier : {"com.example.foundry", "com.example.suite", "com.example.writer"}) {
        install(identifier);
    }
    sweep();
    EXPECT_FALSE(hasRecord("com.example.reader"));
    EXPECT_TRUE(hasRecord("com.example.writer"));
    EXPECT_TRUE(hasLogged(LogLevel::debug, "stray client \"com.example.reader\" detected"));
    EXPECT_EQ(calls(), Calls{});
}

TEST_F(StrayEntrySweep, NothingIsTakenWhileTheApplicationsCannotBeLookedAt)
{
    simulated.applicationRegistry.setComplete(false);
    sweep();
    EXPECT_EQ(calls(), Calls{});
    EXPECT_EQ(simulated.preferences.writes(), 0U);
    EXPECT_TRUE(simulated.log.entries().empty());
    removal->setupForDistributedNotifications();
    announceRemoval(Array{"com.example.foundry"});
    simulated.drain();
    EXPECT_EQ(simulated.userFontManager.knownFontProviders(), Calls{"com.example.suite"})
        << "an announcement is believed all the same";
}

TEST_F(StrayEntrySweep, StrayProvidersAreUnregisteredWithoutWaiting)
{
    simulated.userFontManager.holdOperations();
    sweep();
    EXPECT_EQ(calls(), (Calls{unregistering("com.example.foundry"), unregistering("com.example.suite")}));
    EXPECT_FALSE(hasRecord("com.example.reader"));
    simulated.userFontManager.failNext("the disk is full");
    simulated.userFontManager.finishNext();
    simulated.userFontManager.finishNext();
    EXPECT_TRUE(hasLogged(LogLevel::error,
                          "unregistering stray provider \"com.example.foundry\" error - the disk is full"));
    EXPECT_EQ(simulated.log.countContaining("unregistering stray provider"), 1U);
}

TEST_F(StrayEntrySweep, ALedgerThatIsNoDictionaryHasNoClients)
{
    simulated.preferences.changeFromOutside("issues", PropertyList("nobody"));
    install("com.example.foundry");
    install("com.example.suite");
    sweep();
    EXPECT_TRUE(simulated.log.entries().empty());
}

}  // namespace
}  // namespace typhon
