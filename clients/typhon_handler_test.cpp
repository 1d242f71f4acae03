#include "clients/typhon_handler.h"
#include "platform/simulated/simulated_platform.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

/// A daemon that decides nothing by itself: capabilities are what the test says, and forwarded operations
/// are noted down with their arguments and answered.
class RecordingServer final : public TyphonServer {
public:
    explicit RecordingServer(SimulatedPlatform& simulated)
        : log_(simulated.log), updates_(simulated.platform.processWideQueues),
          mainHandlerQueue_(simulated.queues.createSerialQueue("com.vorlan.typhond")),
          registry(simulated.fileSystem, simulated.log, updates_),
          fontInfo_(simulated.platform, registry, *mainHandlerQueue_,
                    {[](const AuditToken&) { return true; },
                     [](const std::string&) { return std::vector<std::string>{}; }}),
          broadcast_(simulated.platform, registry, fontInfo_, center, *mainHandlerQueue_), ipc_(simulated.ipc)
    {}

    Capabilities capabilitiesFor(const AuditToken& token) override
    {
        askedAbout = token;
        return capabilities;
    }
    bool isCurrentConnectionFontPicker() override { return isFontPicker; }
    PerClientFontInfo& perClientFontInfo() override { return fontInfo_; }
    NotificationCenter& notificationCenter() override { return center; }
    FontChangeBroadcast& fontChangeBroadcast() override { return broadcast_; }
    WorkQueue& mainHandlerQueue() override { return *mainHandlerQueue_; }
    Ipc& ipc() override { return ipc_; }
    Log& log() override { return log_; }

    Task<void> checkin(OptionalDictionaryReply) override { return note("checkin:"); }
    Task<void> checkinForFontPicker(OptionalDictionaryReply) override
    {
        return note("checkinForFontPicker:");
    }
    Task<void> sendFonts(Array, EmptyReply) override { return note("sendFonts:reply:"); }
    Task<void> requestFonts(Array requests, DictionaryReply reply) override
    {
        reply(Dictionary{});
        return note("requestFonts:reply: " + std::to_string(requests.size()));
    }
    Task<void> requestFonts(std::string name, std::shared_ptr<ListenerEndpoint> forClient,
                            BooleanReply reply) override
    {
        reply(forClient == nullptr);
        return note("requestFonts:forClient:reply: " + name);
    }
    Task<void> fontChanged(PropertyList change, EmptyReply reply) override
    {
        reply();
        return note("fontChanged:reply: " + std::to_string(change.asDictionary()->size()));
    }
    Task<void> updatingUserFonts(EmptyReply reply) override
    {
        reply();
        return note("updatingUserFonts:");
    }
    Task<void> scheduleFontFilesDeletion(std::vector<std::string> paths) override
    {
        return note("scheduleFontFilesDeletion: " + paths.at(0));
    }
    Task<void> synchronizeFontAssets(std::vector<std::string> paths, OutcomeReply reply) override
    {
        reply(true, std::nullopt);
        return note("synchronizeFontAssets:reply: " + paths.at(0));
    }
    Task<void> resetIssuedFontsFor(std::string identifier, EmptyReply reply) override
    {
        reply();
        return note("resetIssuedFontsFor:reply: " + identifier);
    }
    Task<void> checkinForSilkpageProcess(std::shared_ptr<ListenerEndpoint>, EmptyReply) override
    {
        return note("checkinForSilkpageProcess:reply:");
    }

    Capabilities capabilities;
    bool isFontPicker = false;
    AuditToken askedAbout;
    NotificationCenter center;
    std::vector<std::string> received;

private:
    Task<void> note(std::string operation)
    {
        received.push_back(std::move(operation));
        co_return;
    }

    Log& log_;
    UserFontUpdates updates_;
    std::shared_ptr<WorkQueue> mainHandlerQueue_;

public:
    UserFontRegistry registry;

private:
    PerClientFontInfo fontInfo_;
    FontChangeBroadcast broadcast_;
    Ipc& ipc_;
};

class TyphonHandlerTest : public testing::Test {
protected:
    /// The reply to a check-in of the client; the outer value is null when there was none.
    std::optional<std::optional<PropertyList>> checkin()
    {
        reply.reset();
        simulated.runAs(client, handler->checkin(keepReply()));
        return reply;
    }
    std::optional<std::optional<PropertyList>> checkinForFontPicker()
    {
        reply.reset();
        simulated.runAs(client, handler->checkinForFontPicker(keepReply()));
        return reply;
    }
    OptionalDictionaryReply keepReply()
    {
        return [this](std::optional<PropertyList> dictionary) {
            EXPECT_FALSE(reply) << "answered twice";
            reply.emplace(std::move(dictionary));
        };
    }
    bool isRegistered() const { return server->center.hasObserver(handler.get(), "fontChanged"); }
    bool wasLogged(const std::string& message) const
    {
        return simulated.log.contains(LogSink::daemon, LogLevel::debug, message);
    }

    SimulatedPlatform simulated;
    std::shared_ptr<RecordingServer> server = std::make_shared<RecordingServer>(simulated);
    std::shared_ptr<TyphonHandler> handler = std::make_shared<TyphonHandler>(server);
    AuditToken client = simulated.processes.add({});
    std::optional<std::optional<PropertyList>> reply;
};

TEST_F(TyphonHandlerTest, AllFlagsStartDownAndAllReferencesNullButTheServer)
{
    EXPECT_FALSE(handler->hasEnumerationEntitlement());
    EXPECT_FALSE(handler->hasFontAccessEntitlement());
    EXPECT_FALSE(handler->isFontProvider());
    EXPECT_EQ(handler->clientConnection(), nullptr);
    EXPECT_EQ(handler->server(), server);
    EXPECT_EQ(handler->processIdentifier(), std::nullopt);
    EXPECT_EQ(handler->webcontentProcessConnections(), std::nullopt);
}

TEST_F(TyphonHandlerTest, AClientWithoutEntitlementsGetsNullAndIsRegisteredAllTheSame)
{
    server->capabilities.identifier = "com.example.app";
    EXPECT_EQ(checkin().value(), std::nullopt);
    EXPECT_TRUE(isRegistered());
    EXPECT_TRUE(wasLogged("connected: com.example.app"));
    EXPECT_EQ(handler->processIdentifier(), std::nullopt);
}

TEST_F(TyphonHandlerTest, TheCapabilitiesAreThoseOfTheCurrentConnectionsProcess)
{
    checkin();
    EXPECT_EQ(server->askedAbout, client);
    EXPECT_TRUE(wasLogged("connected: (null)"));
}

TEST_F(TyphonHandlerTest, CheckInRemembersWhatTheClientMayDo)
{
    server->capabilities = {true, false, false, "com.example.app"};
    checkin();
    EXPECT_TRUE(handler->hasEnumerationEntitlement());
    EXPECT_FALSE(handler->hasFontAccessEntitlement());
    EXPECT_FALSE(handler->isFontProvider());

    server->capabilities = {false, true, true, "com.example.app"};
    checkin();
    EXPECT_FALSE(handler->hasEnumerationEntitlement());
    EXPECT_TRUE(handler->hasFontAccessEntitlement());
    EXPECT_TRUE(handler->isFontProvider());
}

TEST_F(TyphonHandlerTest, CheckInAnswersWithTheClientsFontsAndExtensions)
{
    const PropertyList fonts = Dictionary{{"/f/X/a.ttf", Dictionary{}}};
    server->registry.setUserFontsInfo(fonts);
    server->capabilities = {true, false, false, "com.example.app"};
    const auto dictionary = checkin().value().value();
    EXPECT_EQ(*dictionary.find("fontsInfo"), fonts);
    EXPECT_NE(dictionary.find("extension"), nullptr);
    EXPECT_NE(dictionary.find("extension.fontasset"), nullptr);
    EXPECT_EQ(simulated.sandbox.issued().at(0).token, client);
}

TEST_F(TyphonHandlerTest, OnlyAProvidersIdentifierIsKept)
{
    server->capabilities = {true, true, false, "com.example.app"};
    checkin();
    EXPECT_EQ(handler->processIdentifier(), std::nullopt);
    server->capabilities.allowInstallation = true;
    checkin();
    EXPECT_EQ(handler->processIdentifier(), "com.example.app");
}

TEST_F(TyphonHandlerTest, AProviderHasItsNameBeforeItIsAnsweredSoThatItMissesNoChange)
{
    server->capabilities = {false, false, true, "com.example.app"};
    std::optional<std::string> name;
    simulated.runAs(client, handler->checkin([&](const std::optional<PropertyList>&) {
        name = handler->processIdentifier();
    }));
    EXPECT_EQ(name, "com.example.app");
}

TEST_F(TyphonHandlerTest, TheFontRegistryHelperGetsNullAndNoRegistration)
{
    server->capabilities = {true, true, true, "com.vorlan.Typhon.UserFontManager"};
    EXPECT_EQ(checkin().value(), std::nullopt);
    EXPECT_FALSE(isRegistered());
    EXPECT_TRUE(simulated.log.entries().empty());
    EXPECT_EQ(handler->processIdentifier(), std::nullopt);
}

TEST_F(TyphonHandlerTest, OnlyTheHelpersExactIdentifierIsIgnored)
{
    EXPECT_TRUE(TyphonHandler::isProcessIdentifierToIgnore("com.vorlan.Typhon.UserFontManager"));
    EXPECT_FALSE(TyphonHandler::isProcessIdentifierToIgnore("com.vorlan.Typhon.UserFontManager2"));
    EXPECT_FALSE(TyphonHandler::isProcessIdentifierToIgnore("com.vorlan.typhon.userfontmanager"));
    EXPECT_FALSE(TyphonHandler::isProcessIdentifierToIgnore(std::nullopt));
}

TEST_F(TyphonHandlerTest, AClientThatChecksInTwiceIsRegisteredOnce)
{
    checkin();
    checkin();
    EXPECT_EQ(server->center.observerCount("fontChanged"), 1U);
}

TEST_F(TyphonHandlerTest, AnybodyButTheFontPickerGetsNullFromItsCheckInAndItsFlagsStay)
{
    EXPECT_EQ(checkinForFontPicker().value(), std::nullopt);
    EXPECT_FALSE(handler->hasEnumerationEntitlement());
    EXPECT_FALSE(isRegistered());
    EXPECT_TRUE(simulated.sandbox.issued().empty());
}

TEST_F(TyphonHandlerTest, TheFontPickerSeesAllEnabledFontsAndIsNotRegistered)
{
    server->isFontPicker = true;
    server->registry.setUserFontsInfo(Dictionary{{"/f/X/a.ttf", Dictionary{{"disabled", false}}},
                                                 {"/f/X/b.ttf", Dictionary{{"disabled", true}}}});
    const auto dictionary = checkinForFontPicker().value().value();
    EXPECT_EQ(*dictionary.find("fontsInfo"), PropertyList(Dictionary{{"/f/X/a.ttf", Dictionary{}}}));
    EXPECT_EQ(dictionary.asDictionary()->size(), 3U);
    const auto grants = simulated.sandbox.issued();
    ASSERT_EQ(grants.size(), 2U);
    EXPECT_EQ(grants[0].token, client);
    EXPECT_EQ(grants[0].path, "/var/mobile/Library/UserFonts/FontFiles");
    EXPECT_EQ(grants[1].path, "/var/mobile/Library/UserFonts/FontAssets/");
    EXPECT_TRUE(handler->hasEnumerationEntitlement());
    EXPECT_FALSE(isRegistered());
}

TEST_F(TyphonHandlerTest, TheFontPickersExtensionsAreLeftOutWhenNotIssued)
{
    server->isFontPicker = true;
    simulated.processes.set(client, {.acceptsExtensions = false});
    EXPECT_EQ(checkinForFontPicker().value(), PropertyList(Dictionary{{"fontsInfo", Dictionary{}}}));
}

TEST_F(TyphonHandlerTest, SendFontsNeverAnswersAndReachesNobody)
{
    simulated.runAs(client, handler->sendFonts({}, [] { ADD_FAILURE() << "answered"; }));
    EXPECT_TRUE(server->received.empty());
}

TEST_F(TyphonHandlerTest, TheOtherOperationsAreForwardedWithTheirArgumentsAndReplies)
{
    int replies = 0;
    const auto endpoint = simulated.ipc.anonymousListener()->endpoint();
    simulated.runAs(
        client, handler->requestFonts({Dictionary{}, Dictionary{}}, [&](const PropertyList&) { ++replies; }));
    simulated.runAs(client, handler->requestFonts("Alpha-Regular", endpoint, [&](bool isNull) {
        EXPECT_FALSE(isNull);
        ++replies;
    }));
    simulated.runAs(client, handler->fontChanged(Dictionary{{"kind", 0}}, [&] { ++replies; }));
    simulated.runAs(client, handler->updatingUserFonts([&] { ++replies; }));
    simulated.runAs(client, handler->scheduleFontFilesDeletion({"/a"}));
    simulated.runAs(client, handler->synchronizeFontAssets(
                                {"/b"}, [&](bool, const std::optional<PropertyList>&) { ++replies; }));
    simulated.runAs(client, handler->resetIssuedFontsFor("com.example.app", [&] { ++replies; }));
    EXPECT_EQ(server->received,
              (std::vector<std::string>{
                  "requestFonts:reply: 2", "requestFonts:forClient:reply: Alpha-Regular",
                  "fontChanged:reply: 1", "updatingUserFonts:", "scheduleFontFilesDeletion: /a",
                  "synchronizeFontAssets:reply: /b", "resetIssuedFontsFor:reply: com.example.app"}));
    EXPECT_EQ(replies, 6);
}

TEST_F(TyphonHandlerTest, AHandlerThatGoesIsUnregisteredAndSaysSo)
{
    checkin();
    handler.reset();
    EXPECT_EQ(server->center.observerCount("fontChanged"), 0U);
    EXPECT_TRUE(wasLogged("TyphonHandler deallocated."));
}

TEST_F(TyphonHandlerTest, ItsConnectionAndServerCanBeSet)
{
    const auto connection = simulated.ipc.connectionToService("nowhere");
    handler->setClientConnection(connection);
    EXPECT_EQ(handler->clientConnection(), connection);
    handler->setClientConnection(nullptr);
    EXPECT_EQ(handler->clientConnection(), nullptr);
    handler->setServer(nullptr);
    EXPECT_EQ(handler->server(), nullptr);
}

}  // namespace
}  // namespace typhon
