#include "testing/request_world.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace testing_aid;
using namespace std::chrono_literals;
using Names = std::vector<std::string>;

const std::string alphaPath = fontFiles + "com.example.foundry/alpha.ttf";
const std::string betaPath = fontFiles + "com.example.foundry/beta one.ttf";
const std::string otherBetaPath = fontFiles + "com.example.other/beta.ttf";

/// A request for an enabled, a disabled and an unknown family whose dialog is up.
class RequestAnswersTest : public testing::Test {
protected:
    RequestAnswersTest()
    {
        world.install(alphaPath, {{"Alpha-Regular", "Alpha"}});
        world.install(betaPath, {{"Beta-Regular", "Beta"}}, true);
        world.install(otherBetaPath, {{"Beta-Regular", "Beta"}}, true);
        client.request({family("Alpha"), family("Beta"), family("Gamma")});
    }

    const Names& calls() { return world.simulated.userFontManager.calls(); }
    Names issued() { return world.ledger.issuedFontFilePathsForIdentifier("com.example.app"); }
    std::int32_t inFlight() const { return world.fontRequests.gate().inFlight(); }

    RequestWorld world;
    RequestingClient client{world, world.addApplication("com.example.app")};
};

TEST_F(RequestAnswersTest, TheChosenProvidersFileIsHandedOutSwitchedOnAndRecorded)
{
    EXPECT_EQ(client.replies().size(), 0U);
    ViewService service(world, 0);
    service.answer({choice("Beta", "com.example.foundry")});
    EXPECT_EQ(client.paths(), (Names{alphaPath, betaPath}));
    const auto* entry = client.replies()[0].find(betaPath);
    EXPECT_NE(entry->find("data"), nullptr);
    EXPECT_EQ(entry->find("disabled"), nullptr);
    EXPECT_EQ(calls(), Names{"enableOrDisablePersistentURLs 1"});
    EXPECT_TRUE(world.isSwitchedOn(betaPath));
    EXPECT_FALSE(world.isSwitchedOn(otherBetaPath));
    EXPECT_EQ(issued(), (Names{alphaPath, betaPath}));
    bool isEnabled = false;
    world.resolution.knownFamilyNameFromPostScriptName("Beta-Regular", &isEnabled);
    EXPECT_TRUE(isEnabled) << "the registry was not read afresh";
}

TEST_F(RequestAnswersTest, TheClientIsAnsweredBeforeTheFontIsSwitchedOn)
{
    world.simulated.userFontManager.holdOperations();
    ViewService service(world, 0);
    service.answer({choice("Beta", "com.example.foundry")});
    EXPECT_EQ(client.paths(), (Names{alphaPath, betaPath}));
    EXPECT_TRUE(issued().empty());
    world.advance(10s);
    EXPECT_EQ(inFlight(), 1);
    EXPECT_TRUE(world.simulated.userFontManager.finishNext());
    world.simulated.drain();
    EXPECT_EQ(issued(), (Names{alphaPath, betaPath}));
    world.advance(1s);
    EXPECT_EQ(inFlight(), 0);
}

TEST_F(RequestAnswersTest, AFontThatCannotBeSwitchedOnIsLoggedAndTheTurnEnds)
{
    world.simulated.userFontManager.failNext("the helper is gone");
    ViewService service(world, 0);
    service.answer({choice("Beta", "com.example.foundry")});
    EXPECT_TRUE(
        world.simulated.log.contains(LogSink::daemon, LogLevel::error,
                                     "enableOrDisablePersistentURLs:enabled: failed: the helper is gone"));
    world.advance(1s);
    EXPECT_EQ(inFlight(), 0);
}

TEST_F(RequestAnswersTest, AnEmptyAnswerHandsOutWhatWasThere)
{
    ViewService service(world, 0);
    service.answer({});
    EXPECT_EQ(client.paths(), Names{alphaPath});
    EXPECT_EQ(calls(), Names{});
    EXPECT_EQ(issued(), Names{alphaPath});
}

TEST_F(RequestAnswersTest, AProviderWhoseDirectoryDoesNotHoldTheFileSwitchesNothingOn)
{
    ViewService service(world, 0);
    service.answer({choice("Beta", "com.example.stranger")});
    EXPECT_EQ(client.paths(), Names{alphaPath});
    EXPECT_FALSE(world.isSwitchedOn(betaPath));
    EXPECT_FALSE(world.isSwitchedOn(otherBetaPath));
    EXPECT_EQ(calls(), Names{});
}

TEST_F(RequestAnswersTest, AnswersThatNameNothingOrAreMalformedSwitchNothingOn)
{
    ViewService service(world, 0);
    service.answer({choice("Gamma", "com.example.foundry"), choice("Nowhere", "com.example.foundry"),
                    Dictionary{{"uniqueID", "Beta"}}, Dictionary{{"installProvider", "com.example.foundry"}},
                    Dictionary{{"uniqueID", "Beta"}, {"installProvider", 7}},
                    Dictionary{{"uniqueID", Array{"Beta"}}, {"installProvider", "com.example.foundry"}},
                    choice("Alpha", "com.example.foundry"), Dictionary{}});
    EXPECT_EQ(client.paths(), Names{alphaPath});
    EXPECT_EQ(calls(), Names{});
}

TEST_F(RequestAnswersTest, TheUserMaySwitchOnAFamilyThatWasNotAskedFor)
{
    const auto deltaPath = fontFiles + "com.example.foundry/delta.ttf";
    world.install(deltaPath, {{"Delta-Regular", "Delta"}}, true);
    ViewService service(world, 0);
    service.answer({choice("Delta", "com.example.foundry")});
    EXPECT_EQ(client.paths(), (Names{alphaPath, deltaPath}));
    EXPECT_TRUE(world.isSwitchedOn(deltaPath));
}

TEST_F(RequestAnswersTest, OfSeveralAnswersForOneFamilyTheLastProviderCounts)
{
    ViewService service(world, 0);
    service.answer({choice("Beta", "com.example.foundry"), choice("Beta", "com.example.other"),
                    Dictionary{{"uniqueID", "Beta"}}});
    EXPECT_EQ(client.paths(), (Names{alphaPath, otherBetaPath}));
}

TEST_F(RequestAnswersTest, TheCountsAreStoredWhileTheDialogIsUp)
{
    EXPECT_EQ(world.missed(), 1);
    EXPECT_EQ(world.resolved(), 1);
}

TEST_F(RequestAnswersTest, AnUnansweredDialogKeepsTheGate)
{
    RequestingClient other(world, world.addApplication("com.example.other"));
    other.request({family("Alpha")});
    world.advance(240h);
    EXPECT_EQ(client.replies().size(), 0U);
    EXPECT_EQ(other.replies().size(), 0U);
    EXPECT_EQ(inFlight(), 2);
}

TEST_F(RequestAnswersTest, TheNextRequestsTurnComesASecondAfterTheAnswer)
{
    RequestingClient other(world, world.addApplication("com.example.other"));
    other.request({family("Alpha")});
    ViewService service(world, 0);
    service.answer({});
    bool isFree = false;
    world.mainHandlerQueue->async([&] { isFree = true; });
    world.advance(999ms);
    EXPECT_TRUE(isFree);
    EXPECT_EQ(other.replies().size(), 0U);
    EXPECT_EQ(service.outcomes(), Names{});
    world.advance(1ms);
    EXPECT_EQ(other.paths(), Names{alphaPath});
    EXPECT_EQ(service.outcomes(), Names{"answered"});
}

TEST_F(RequestAnswersTest, ASecondAnswerSwitchesFontsOnButRepliesAndOpensTheGateNoMore)
{
    ViewService service(world, 0);
    service.answer({choice("Beta", "com.example.foundry")});
    service.answer({choice("Beta", "com.example.other")});
    EXPECT_FALSE(world.isSwitchedOn(otherBetaPath));
    world.advance(1s);
    EXPECT_TRUE(world.isSwitchedOn(otherBetaPath));
    EXPECT_EQ(client.paths(), (Names{alphaPath, betaPath}));
    EXPECT_EQ(issued(), (Names{alphaPath, betaPath, otherBetaPath}));
    EXPECT_EQ(inFlight(), 0);
    world.advance(10s);
    EXPECT_EQ(inFlight(), 0);
    // The gate lets one through, not two.
    RequestingClient second(world, world.addApplication("com.example.second"));
    RequestingClient third(world, world.addApplication("com.example.third"));
    second.request({family("Alpha")});
    third.request({family("Alpha")});
    EXPECT_EQ(second.replies().size(), 1U);
    EXPECT_EQ(third.replies().size(), 0U);
}

TEST_F(RequestAnswersTest, FontsThatAreRemovedWhileTheDialogIsUpAreNotHandedOut)
{
    world.simulated.fileSystem.remove(UserFontRegistry::path);
    world.registry.invalidateUserFonts();
    ViewService service(world, 0);
    service.answer({choice("Beta", "com.example.foundry")});
    EXPECT_EQ(client.paths(), Names{alphaPath});
    EXPECT_EQ(calls(), Names{});
    EXPECT_EQ(issued(), Names{});
}

TEST_F(RequestAnswersTest, AnAnswerAfterTheDaemonsEndIsIgnored)
{
    ViewService service(world, 0);
    world.daemon.reset();
    service.answer({choice("Beta", "com.example.foundry")});
    EXPECT_EQ(client.replies().size(), 0U);
    EXPECT_FALSE(world.isSwitchedOn(betaPath));
}

}  // namespace
}  // namespace typhon
