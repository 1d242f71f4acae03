#include "clients/typhon_handler.h"
#include "daemon/typhon_daemon.h"
#include "platform/simulated/simulated_platform.h"
#include "protocol/wire.h"

#include <chrono>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

const std::string fontPath = "/var/mobile/Library/UserFonts/FontFiles/com.example.provider/a.ttf";
const std::string secondFontPath = "/var/mobile/Library/UserFonts/FontFiles/com.example.provider/b.ttf";

/// What became of one call.
struct Outcome {
    std::vector<Arguments> replies;
    std::vector<std::string> errors;

    /// The dictionary of a reply that may be null.
    std::optional<PropertyList> dictionary() const
    {
        return wire::fromNullable(std::get<PropertyList>(replies.at(0).at(0)));
    }
};

Task<void> keep(std::shared_ptr<Outcome> outcome, Arguments results)
{
    outcome->replies.push_back(std::move(results));
    co_return;
}

std::shared_ptr<Outcome> callOn(const std::shared_ptr<Connection>& client, const wire::Operation& operation,
                                Arguments arguments = {})
{
    auto outcome = std::make_shared<Outcome>();
    client->call(
        operation.interface, operation.member, std::move(arguments),
        [outcome](Arguments results) { return keep(outcome, std::move(results)); },
        [outcome](const IpcError& error) { outcome->errors.push_back(error.name); });
    return outcome;
}

class TyphonDaemonTest : public testing::Test {
protected:
    TyphonDaemonTest()
    {
        Dictionary entry{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}};
        simulated.fileSystem.addFile(UserFontRegistry::path,
                                     Dictionary{{fontPath, entry}, {secondFontPath, entry}});
        // What is not installed loses its fonts, and its record, at the start.
        simulated.applicationRegistry.install({"com.example.provider", "1.0", false});
        simulated.applicationRegistry.install({"com.example.app", "1.0", false});
    }

    AuditToken addProcess(const std::string& identifier, std::vector<std::string> userFonts)
    {
        return simulated.processes.add(
            {.signingIdentifier = identifier,
             .entitlements = {{"com.vorlan.developer.user-fonts", arrayOfStrings(userFonts)}}});
    }
    /// A client's connection to the service.
    std::shared_ptr<Connection> connect(const AuditToken& token)
    {
        auto client = simulated.ipc.connectClient(wire::serviceName, token);
        client->setRemoteObjectInterfaces(wire::typhonDaemonInterfaces());
        client->resume();
        return client;
    }
    std::shared_ptr<Outcome> call(const std::shared_ptr<Connection>& client, const wire::Operation& operation,
                                  Arguments arguments = {})
    {
        auto outcome = callOn(client, operation, std::move(arguments));
        simulated.drain();
        return outcome;
    }
    /// Has the daemon decide about a connection of that process; gives the connection's handler.
    std::shared_ptr<TyphonHandler> accept(const SimulatedConnectionPair& pair)
    {
        EXPECT_TRUE(daemon->listener(*simulated.ipc.anonymousListener(), pair.accepted));
        return std::dynamic_pointer_cast<TyphonHandler>(pair.accepted->exportedObject());
    }

    SimulatedPlatform simulated;
    std::shared_ptr<TyphonDaemon> daemon = std::make_shared<TyphonDaemon>(simulated.platform);
};

TEST_F(TyphonDaemonTest, TheDaemonStartsNothingBeforeItsStartUp)
{
    EXPECT_EQ(daemon->mainHandlerQueue().label(), "com.vorlan.typhond");
    simulated.drain();
    EXPECT_EQ(simulated.fileSystem.reads(), 0U);
    EXPECT_EQ(simulated.userFontManager.profileSynchronizations(), 0U);
    EXPECT_EQ(call(connect(addProcess("com.example.app", {})), wire::checkin)->replies.size(), 0U);
}

TEST_F(TyphonDaemonTest, TheRegistryIsLoadedBeforeTheFirstClientIsServed)
{
    daemon->setupForSluiceService();
    EXPECT_EQ(simulated.fileSystem.reads(UserFontRegistry::path), 1U);
    const auto client = connect(addProcess("com.example.app", {"font-enumeration"}));
    const auto reply = call(client, wire::checkin);
    EXPECT_EQ(reply->dictionary()->find("fontsInfo")->asDictionary()->size(), 2U);
    EXPECT_EQ(simulated.fileSystem.reads(UserFontRegistry::path), 1U);
}

TEST_F(TyphonDaemonTest, StartUpSynchronisesProfileFontsOnceAndMigratesTheLayout)
{
    startUp(*daemon);
    simulated.userFontManager.finishProfileSynchronizations();
    EXPECT_EQ(simulated.userFontManager.profileSynchronizations(), 1U);
    EXPECT_EQ(simulated.preferences.durableValue("version"), PropertyList(3));
}

TEST_F(TyphonDaemonTest, RunServesClientsOnTheMainLoop)
{
    startUp(*daemon);
    const auto outcome = callOn(connect(addProcess("com.example.app", {"app-usage"})), wire::checkin);
    EXPECT_TRUE(outcome->replies.empty());
    daemon->run();
    EXPECT_EQ(outcome->replies.size(), 1U);
}

TEST_F(TyphonDaemonTest, EveryConnectionIsAcceptedAndGetsAHandlerOfItsOwn)
{
    const auto nobody = simulated.processes.add({});
    const auto gone = simulated.processes.add({});
    simulated.processes.exit(gone);
    const auto first = accept(simulated.connect(nobody));
    const auto second = accept(simulated.connect(nobody));
    const auto third = accept(simulated.connect(gone));
    EXPECT_NE(first, second);
    EXPECT_NE(second, third);
    EXPECT_EQ(first->server(), daemon);
}

TEST_F(TyphonDaemonTest, AConnectionIsHeldByItsHandlerUntilItIsInvalidated)
{
    const auto pair = simulated.connect(addProcess("com.example.app", {"app-usage"}));
    const auto handler = accept(pair);
    EXPECT_EQ(handler->clientConnection(), pair.accepted);
    pair.client->invalidate();
    simulated.drain();
    EXPECT_EQ(handler->clientConnection(), nullptr);
    EXPECT_EQ(pair.accepted->exportedObject(), nullptr);
}

TEST_F(TyphonDaemonTest, AnInvalidatedConnectionLeavesNoHandlerBehind)
{
    std::weak_ptr<TyphonHandler> handler;
    {
        auto pair =
            simulated.connect(addProcess("com.example.app", {"app-usage"}), wire::typhonDaemonInterfaces());
        handler = accept(pair);
        call(pair.client, wire::checkin);
        EXPECT_EQ(daemon->notificationCenter().observerCount("fontChanged"), 1U);
        pair.client->invalidate();
    }
    simulated.drain();
    EXPECT_TRUE(handler.expired());
    EXPECT_EQ(daemon->notificationCenter().observerCount("fontChanged"), 0U);
    EXPECT_TRUE(simulated.log.contains(LogSink::daemon, LogLevel::debug, "TyphonHandler deallocated."));
}

TEST_F(TyphonDaemonTest, AClientThatVanishesLeavesNoHandlerBehind)
{
    const auto token = addProcess("com.example.app", {"app-usage"});
    std::weak_ptr<TyphonHandler> handler = accept(simulated.connect(token));
    simulated.processes.exit(token);
    simulated.ipc.endProcess(token);
    simulated.drain();
    EXPECT_TRUE(handler.expired());
    EXPECT_EQ(simulated.ipc.connectionCount(), 0U);
}

TEST_F(TyphonDaemonTest, AnApplicationChecksInAndSeesExactlyWhatWasIssuedToIt)
{
    startUp(*daemon);
    daemon->issuedPathsLedger().recordIssuedFontPaths({secondFontPath}, "com.example.app");
    const auto reply = call(connect(addProcess("com.example.app", {"app-usage"})), wire::checkin);
    const auto& fonts = *reply->dictionary()->find("fontsInfo")->asDictionary();
    ASSERT_EQ(fonts.size(), 1U);
    EXPECT_EQ(fonts.begin()->first, secondFontPath);
    EXPECT_NE(fonts.begin()->second.find("data"), nullptr);
}

TEST_F(TyphonDaemonTest, AClientWithoutEntitlementsGetsNull)
{
    startUp(*daemon);
    const auto reply = call(connect(addProcess("com.example.app", {})), wire::checkin);
    EXPECT_EQ(reply->dictionary(), std::nullopt);
    EXPECT_EQ(daemon->notificationCenter().observerCount("fontChanged"), 1U);
}

TEST_F(TyphonDaemonTest, OnlyTheFontPickersCheckInIsAnswered)
{
    startUp(*daemon);
    const auto app = connect(addProcess("com.example.app", {"font-enumeration"}));
    EXPECT_EQ(call(app, wire::checkinForFontPicker)->dictionary(), std::nullopt);
    const auto picker = connect(addProcess("com.vorlan.Panekit.FontPicker", {}));
    const auto reply = call(picker, wire::checkinForFontPicker);
    EXPECT_EQ(reply->dictionary()->find("fontsInfo")->asDictionary()->size(), 2U);
}

TEST_F(TyphonDaemonTest, TwoClientsAreAcknowledgedOnceEach)
{
    startUp(*daemon);
    const auto token = addProcess("com.example.app", {});
    const auto first = callOn(connect(token), wire::updatingUserFonts);
    const auto second = callOn(connect(token), wire::updatingUserFonts);
    simulated.drain();
    EXPECT_EQ(first->replies.size(), 1U);
    EXPECT_EQ(second->replies.size(), 1U);
}

TEST_F(TyphonDaemonTest, AnEntitledToolResetsARecordOverTheWire)
{
    startUp(*daemon);
    daemon->issuedPathsLedger().recordIssuedFontPaths({fontPath}, "com.example.app");
    const auto reset = [&](PropertyList value) {
        const auto token = simulated.processes.add(
            {.signingIdentifier = "com.example.tool",
             .entitlements = {{"com.vorlan.Typhon.allow-reset-issued-fonts", std::move(value)}}});
        const auto outcome =
            call(connect(token), wire::resetIssuedFontsFor, {PropertyList("com.example.app")});
        EXPECT_EQ(outcome->replies.size(), 1U);
        return daemon->issuedPathsLedger().issuedFontFilePathsForIdentifier("com.example.app").empty();
    };
    EXPECT_FALSE(reset("true"));
    EXPECT_TRUE(reset(true));
}

TEST_F(TyphonDaemonTest, ACallOutsideTheProtocolFailsAndTheConnectionGoesOn)
{
    startUp(*daemon);
    const auto client = simulated.ipc.connectClient(wire::serviceName, addProcess("com.example.app", {}));
    auto unknown = wire::checkin;
    unknown.member = "checkout";
    auto interfaces = *wire::typhonDaemonInterfaces();
    interfaces[0].members.push_back({unknown.member, "", "", true});
    client->setRemoteObjectInterfaces(
        std::make_shared<const std::vector<InterfaceDescription>>(std::move(interfaces)));
    client->resume();
    EXPECT_EQ(call(client, unknown)->errors, std::vector<std::string>{ipc_errors::unknownMethod});
    EXPECT_EQ(call(client, wire::checkin)->replies.size(), 1U);
}

TEST_F(TyphonDaemonTest, SendFontsIsNeverAnswered)
{
    startUp(*daemon);
    const auto client = connect(addProcess("com.example.app", {"app-usage"}));
    const auto outcome = call(client, wire::sendFonts, {PropertyList(Array{})});
    EXPECT_TRUE(outcome->replies.empty());
    EXPECT_TRUE(outcome->errors.empty());
    EXPECT_EQ(call(client, wire::checkin)->replies.size(), 1U);
}

TEST_F(TyphonDaemonTest, AnApplicationAsksForAFontAndSeesItAtItsNextCheckIn)
{
    startUp(*daemon);
    const auto token = addProcess("com.example.app", {"app-usage"});
    const auto client = connect(token);
    const Dictionary request{{kLFFontNameAttribute, "Alpha-Regular"}};
    const auto requested = call(client, wire::requestFonts, {PropertyList(Array{request})});
    const auto& fonts = std::get<PropertyList>(requested->replies.at(0).at(0));
    EXPECT_EQ(fonts.asDictionary()->size(), 2U);
    simulated.scheduler.advance(std::chrono::seconds(1));
    const auto reply = call(client, wire::checkin);
    EXPECT_EQ(reply->dictionary()->find("fontsInfo")->asDictionary()->size(), 2U);
}

TEST_F(TyphonDaemonTest, ADialogThatNobodyAnswersDoesNotKeepTheDaemonAlive)
{
    const std::weak_ptr<TyphonDaemon> observed = daemon;
    {
        startUp(*daemon);
        const auto token = addProcess("com.example.app", {"app-usage"});
        simulated.processLifecycle.setVisible(token, true);
        const auto client = connect(token);
        const Dictionary request{{kLFFontFamilyNameAttribute, "Gamma"}};
        call(client, wire::requestFonts, {PropertyList(Array{request})});
        EXPECT_EQ(simulated.remoteAlerts.alerts().size(), 1U);
        EXPECT_EQ(daemon->missingFontsDialog().missingFontsDialogHandler()->daemon(), daemon);
        client->invalidate();
        simulated.drain();
    }
    daemon.reset();
    EXPECT_TRUE(observed.expired());
}

TEST_F(TyphonDaemonTest, TheSharedDaemonIsMadeOnce)
{
    // Stays for the process: the platform it was made over must stay too.
    static SimulatedPlatform shared;
    const auto first = TyphonDaemon::sharedDaemon(shared.platform);
    EXPECT_EQ(first, TyphonDaemon::sharedDaemon(shared.platform));
    EXPECT_EQ(first->mainHandlerQueue().label(), "com.vorlan.typhond");
}

}  // namespace
}  // namespace typhon
