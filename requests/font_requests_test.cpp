#include "testing/request_world.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace testing_aid;
using namespace std::chrono_literals;
using Names = std::vector<std::string>;

const std::string alphaPath = fontFiles + "com.example.foundry/alpha.ttf";
const std::string betaPath = fontFiles + "com.example.foundry/beta.ttf";
const std::string refusal = "Application \"(null)\" does not have an entitlement to use custom fonts.";

std::string waiting(const std::string& identifier)
{
    return "Previous LFFontManagerRequestFonts call has not been resolved.  This call from \"" + identifier +
           "\" is blocked until the previous call is acknowledged by the user.";
}

/// A device with an enabled family Alpha and a disabled family Beta.
class FontRequestsTest : public testing::Test {
protected:
    FontRequestsTest()
    {
        world.install(alphaPath,
                      {{"Alpha-Regular", "Alpha"}, {"Alpha-Bold", "Alpha"}, {"Alpha-Thin", "Alpha"}});
        world.install(betaPath, {{"Beta-Regular", "Beta"}}, true);
    }

    std::size_t systemLogCount(const std::string& message)
    {
        return world.simulated.log.count(LogSink::system, LogLevel::defaultLevel, message);
    }
    std::int32_t inFlight() const { return world.fontRequests.gate().inFlight(); }
    std::size_t alerts() const { return world.simulated.remoteAlerts.alerts().size(); }
    Dictionary onlyEvent()
    {
        const auto& events = world.simulated.analytics.events();
        EXPECT_EQ(events.size(), 1U);
        EXPECT_EQ(events.at(0).name, "com.vorlan.font-privacy");
        return *events.at(0).payload.asDictionary();
    }
    /// The replies to a caller with that entitlement value.
    std::vector<PropertyList> repliesTo(std::optional<PropertyList> userFonts)
    {
        RequestingClient client(world, world.add("com.example.app", std::move(userFonts)));
        client.request({family("Alpha")});
        world.advance(1s);
        return client.replies();
    }

    RequestWorld world;
};

TEST_F(FontRequestsTest, ACallerWithoutTheEntitlementIsRefusedWithAnEmptyDictionary)
{
    const std::vector<PropertyList> empty{Dictionary{}};
    EXPECT_EQ(repliesTo(std::nullopt), empty);
    EXPECT_EQ(repliesTo("app-usage"), empty);
    EXPECT_EQ(repliesTo(Array{}), empty);
    EXPECT_EQ(repliesTo(Array{"system-installation", 1}), empty);
    EXPECT_EQ(systemLogCount(refusal), 4U);
    EXPECT_EQ(inFlight(), 0);
    EXPECT_EQ(world.simulated.analytics.offered(), 0U);
}

TEST_F(FontRequestsTest, AnEntitledCallerWithoutAnIdentifierAndOneThatIsGoneAreRefused)
{
    const auto nameless = world.simulated.processes.add(
        {.entitlements = {{"com.vorlan.developer.user-fonts", Array{"app-usage"}}}});
    const auto gone = world.addApplication("com.example.gone");
    RequestingClient first(world, nameless);
    RequestingClient second(world, gone);
    world.simulated.processes.exit(gone);
    first.request({family("Alpha")});
    second.request({family("Alpha")});
    EXPECT_EQ(first.paths(), Names{});
    EXPECT_EQ(second.paths(), Names{});
    EXPECT_EQ(systemLogCount(refusal), 2U);
}

TEST_F(FontRequestsTest, ACallerWithAppUsageOnlyGetsItsFontsWithoutEnumeration)
{
    RequestingClient usage(world, world.add("com.example.usage", Array{"app-usage"}));
    usage.request({family("Alpha")});
    EXPECT_NE(usage.replies().at(0).find(alphaPath)->find("data"), nullptr);
    world.advance(1s);
    RequestingClient enumerating(world, world.add("com.example.all", Array{"font-enumeration"}));
    enumerating.request({family("Alpha")});
    EXPECT_EQ(enumerating.replies().at(0).find(alphaPath)->find("data"), nullptr);
}

TEST_F(FontRequestsTest, ASatisfiedRequestIsAnsweredAtOnceWithoutADialog)
{
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request({family("Alpha"), postScript("Alpha-Bold")});
    EXPECT_EQ(client.paths(), Names{alphaPath});
    EXPECT_EQ(alerts(), 0U);
    EXPECT_EQ(world.ledger.issuedFontFilePathsForIdentifier("com.example.app"), Names{alphaPath});
    world.advance(1s);
    EXPECT_EQ(world.missed(), 0);
    EXPECT_EQ(world.resolved(), 1);
    EXPECT_TRUE(world.simulated.log.contains(LogSink::daemon, LogLevel::debug,
                                             "requestFonts -  ({ LFFontFamilyNameAttribute = \"Alpha\"; }, { "
                                             "LFFontNameAttribute = \"Alpha-Bold\"; })"));
}

TEST_F(FontRequestsTest, AnEmptyRequestIsAnsweredWithNothingAndStoresNoCount)
{
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request({});
    EXPECT_EQ(client.replies(), std::vector<PropertyList>{Dictionary{}});
    world.advance(1s);
    EXPECT_EQ(alerts(), 0U);
    EXPECT_EQ(world.simulated.preferences.durableValue("missed"), std::nullopt);
    EXPECT_EQ(world.simulated.preferences.durableValue("resolved"), std::nullopt);
    EXPECT_EQ(inFlight(), 0);
}

TEST_F(FontRequestsTest, ThreeFacesOfOneFamilyAreReportedAsOneResolved)
{
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request({postScript("Alpha-Regular"), postScript("Alpha-Bold"), postScript("Alpha-Thin")});
    EXPECT_EQ(onlyEvent(),
              (Dictionary{{"name", "com.example.app"}, {"misses", 0}, {"suggestions", 0}, {"resolved", 1}}));
}

TEST_F(FontRequestsTest, TheReportIsSentBeforeTheDialogIsAnswered)
{
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request({family("Alpha"), family("Beta"), family("Gamma"), family("Delta")});
    EXPECT_EQ(client.replies().size(), 0U);
    EXPECT_EQ(onlyEvent(),
              (Dictionary{{"name", "com.example.app"}, {"misses", 2}, {"suggestions", 1}, {"resolved", 1}}));
}

TEST_F(FontRequestsTest, ARequestForUnknownNamesOnlyIsMissedAndNotResolved)
{
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request({family("Gamma"), postScript("Delta-Regular")});
    EXPECT_EQ(onlyEvent().at("resolved"), PropertyList(0));
    ViewService service(world, 0);
    service.answer({});
    EXPECT_EQ(client.paths(), Names{});
    world.advance(1s);
    EXPECT_EQ(world.missed(), 1);
    EXPECT_EQ(world.simulated.preferences.durableValue("resolved"), std::nullopt);
}

TEST_F(FontRequestsTest, NothingIsBuiltWhenNobodyCollectsReports)
{
    world.simulated.analytics.setCollecting(false);
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request({family("Alpha")});
    EXPECT_EQ(client.paths(), Names{alphaPath});
    EXPECT_EQ(world.simulated.analytics.offered(), 1U);
    EXPECT_TRUE(world.simulated.analytics.events().empty());
}

TEST_F(FontRequestsTest, TheMainHandlerQueueIsHeldForASecondAfterAnAnswerWithoutADialog)
{
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request({family("Alpha")});
    bool isFree = false;
    world.mainHandlerQueue->async([&] { isFree = true; });
    world.advance(999ms);
    EXPECT_FALSE(isFree);
    EXPECT_EQ(inFlight(), 1);
    world.advance(1ms);
    EXPECT_TRUE(isFree);
    EXPECT_EQ(inFlight(), 0);
}

TEST_F(FontRequestsTest, TheGateIsOpenedFromTheMainQueue)
{
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request({family("Alpha")});
    std::function<void()> release;
    AwaitCompletion<void>::Start hold = [&](std::function<void()> done) { release = std::move(done); };
    struct Holder {
        static Task<void> hold(AwaitCompletion<void>::Start start)
        {
            auto completion = awaitCompletion<void>(std::move(start));
            co_await completion;
        }
    };
    world.simulated.queues.mainQueue().async(Holder::hold(hold));
    world.advance(2s);
    EXPECT_EQ(inFlight(), 1);
    release();
    world.simulated.drain();
    EXPECT_EQ(inFlight(), 0);
}

TEST_F(FontRequestsTest, ASecondRequestWaitsForTheFirstOnesTurnAndItsPause)
{
    RequestingClient first(world, world.addApplication("com.example.first"));
    RequestingClient second(world, world.addApplication("com.example.second"));
    first.request({family("Alpha")});
    second.request({family("Alpha")});
    EXPECT_EQ(systemLogCount(waiting("com.example.second")), 1U);
    EXPECT_EQ(systemLogCount(waiting("com.example.first")), 0U);
    EXPECT_EQ(inFlight(), 2);
    world.advance(999ms);
    EXPECT_EQ(second.replies().size(), 0U);
    world.advance(1ms);
    EXPECT_EQ(second.paths(), Names{alphaPath});
    EXPECT_EQ(first.replies().size(), 1U);
    world.advance(1s);
    EXPECT_EQ(inFlight(), 0);
}

TEST_F(FontRequestsTest, AWaitingRequestHoldsItsConnectionAndNothingElse)
{
    RequestingClient first(world, world.addApplication("com.example.first"));
    RequestingClient second(world, world.addApplication("com.example.second"));
    RequestingClient third(world, world.addApplication("com.example.third"));
    first.request({family("Gamma")});
    second.request({family("Alpha")});
    EXPECT_FALSE(*second.callSomethingElse());
    EXPECT_TRUE(*third.callSomethingElse());
    // The first one's connection is free again: its answer will come from the dialog.
    EXPECT_TRUE(*first.callSomethingElse());
    bool isFree = false;
    world.mainHandlerQueue->async([&] { isFree = true; });
    world.simulated.drain();
    EXPECT_TRUE(isFree);
}

TEST_F(FontRequestsTest, TwoThousandWaitingClientsAreAnsweredInOrderEachOnce)
{
    std::vector<std::unique_ptr<RequestingClient>> clients;
    for (int number = 0; number < 2000; ++number) {
        clients.push_back(std::make_unique<RequestingClient>(world, world.addApplication("com.example.app")));
        clients.back()->request({family("Alpha")});
    }
    EXPECT_EQ(inFlight(), 2000);
    for (std::size_t turn = 0; turn < clients.size(); ++turn) {
        ASSERT_EQ(clients[turn]->replies().size(), 1U) << turn;
        if (turn + 1 < clients.size()) {
            ASSERT_EQ(clients[turn + 1]->replies().size(), 0U) << turn;
        }
        world.advance(1s);
    }
    EXPECT_EQ(inFlight(), 0);
    for (const auto& client : clients) {
        EXPECT_EQ(client->paths(), Names{alphaPath});
    }
}

TEST_F(FontRequestsTest, AVanishedClientsRequestTakesItsTurnAndIsNotShownToTheUser)
{
    RequestingClient first(world, world.addApplication("com.example.first"));
    const auto token = world.addApplication("com.example.vanished");
    RequestingClient vanished(world, token);
    first.request({family("Alpha")});
    vanished.request({family("Gamma")});
    world.simulated.processes.exit(token);
    EXPECT_EQ(inFlight(), 2);
    world.advance(1s);
    EXPECT_EQ(alerts(), 0U);
    EXPECT_EQ(world.simulated.log.countContaining(
                  "An application (pid:" + std::to_string(token.processIdentifier) + ") tried to show"),
              1U);
    EXPECT_EQ(inFlight(), 1);
    world.advance(1s);
    EXPECT_EQ(inFlight(), 0);
}

TEST_F(FontRequestsTest, AHundredThousandNamesInOneCallAreOneDialog)
{
    Array requests;
    for (int number = 0; number < 100'000; ++number) {
        requests.push_back(family("Family " + std::to_string(number)));
    }
    requests.push_back(Dictionary{{kLFFontFamilyNameAttribute, 7}});
    requests.push_back(family(std::string(1U << 20, 'a')));
    RequestingClient client(world, world.addApplication("com.example.app"));
    client.request(std::move(requests));
    ASSERT_EQ(alerts(), 1U);
    EXPECT_EQ(world.simulated.remoteAlerts.alerts()[0]->activations.at(0).find("fonts")->asArray()->size(),
              100'001U);
    for (const auto& entry : world.simulated.log.entries()) {
        EXPECT_LT(entry.message.size(), 2000U);
    }
}

}  // namespace
}  // namespace typhon
