#include "clients/typhon_handler.h"
#include "daemon/typhon_daemon.h"
#include "platform/simulated/simulated_platform.h"
#include "protocol/wire.h"

#include <gtest/gtest.h>

// What a web-content host brings about when it hands over an endpoint of a content process.

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

const std::string fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";
const std::string ownFont = fontFiles + "com.example.host/a.ttf";
const std::string otherFont = fontFiles + "com.example.other/b.ttf";
const PropertyList entry = Dictionary{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}};

/// A content process: listens, and answers as the test wants.
class ContentProcess final : public ListenerDelegate,
                             public ExportedObject,
                             public std::enable_shared_from_this<ContentProcess> {
public:
    ContentProcess(SimulatedPlatform& simulated, AuditToken ownToken)
        : token(ownToken), listener_(simulated.ipc.process(token)->anonymousListener())
    {}

    std::shared_ptr<ListenerEndpoint> listen()
    {
        listener_->setDelegate(weak_from_this());
        listener_->resume();
        return listener_->endpoint();
    }
    bool listener(Listener&, std::shared_ptr<Connection> newConnection) override
    {
        newConnection->setExportedInterfaces(wire::typhonSilkpageSupportServerInterfaces());
        newConnection->setExportedObject(shared_from_this());
        newConnection->resume();
        connections.push_back(newConnection);
        return true;
    }
    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        const bool isPing = call->member() == wire::pingSilkpageProcess.member;
        pings += isPing ? 1 : 0;
        if (!isPing) {
            received.push_back(wire::fromNullable(std::get<PropertyList>(call->arguments().at(0))));
        }
        if (isPing ? refusesPing : refusesFonts) {
            call->fail({ipc_errors::failed, "no"});
        } else if (isPing ? answersPing : answersFonts) {
            call->reply({});
            call->reply({});
        } else {
            held.push_back(call);
        }
        co_return;
    }

    AuditToken token;
    bool answersPing = true;
    bool answersFonts = true;
    bool refusesPing = false;
    bool refusesFonts = false;
    int pings = 0;
    std::vector<std::optional<PropertyList>> received;
    std::vector<std::shared_ptr<IncomingCall>> held;
    std::vector<std::shared_ptr<Connection>> connections;

private:
    std::shared_ptr<Listener> listener_;
};

Task<void> count(int* counter)
{
    ++*counter;
    co_return;
}

class WebContentTest : public testing::Test {
protected:
    WebContentTest()
    {
        simulated.fileSystem.addFile(UserFontRegistry::path,
                                     Dictionary{{ownFont, entry}, {otherFont, entry}});
        simulated.preferences.changeFromOutside(
            "issues", Dictionary{{"com.example.host", Array{"U/com.example.other/b.ttf"}}});
        daemon->setupForSluiceService();
    }

    AuditToken addProcess(const std::string& identifier, const std::vector<std::string>& capabilities)
    {
        return simulated.processes.add(
            {.signingIdentifier = identifier,
             .entitlements = {{"com.vorlan.developer.user-fonts", arrayOfStrings(capabilities)}}});
    }
    /// An application that checked in with those capabilities.
    void addHost(const std::vector<std::string>& capabilities)
    {
        hostToken = addProcess("com.example.host", capabilities);
        auto pair = simulated.connect(hostToken, wire::typhonDaemonInterfaces());
        host = pair.client;
        EXPECT_TRUE(daemon->listener(*simulated.ipc.anonymousListener(), pair.accepted));
        handler = std::dynamic_pointer_cast<TyphonHandler>(pair.accepted->exportedObject());
        host->call(wire::checkin.interface, wire::checkin.member, {}, nullptr, nullptr);
        simulated.drain();
        issuedBefore = simulated.sandbox.issued().size();
        connectionsBefore = simulated.ipc.connectionCount();
    }
    /// Hands the endpoint over and lets happen what happens.
    void checkIn(std::shared_ptr<ListenerEndpoint> endpoint)
    {
        host->call(
            wire::checkinForSilkpageProcess.interface, wire::checkinForSilkpageProcess.member,
            {std::move(endpoint)}, [this](const Arguments&) { return count(&replies); },
            [this](const IpcError& error) { errors.push_back(error.name); });
        simulated.drain();
    }
    std::shared_ptr<ContentProcess> addContent()
    {
        return std::make_shared<ContentProcess>(simulated, simulated.processes.add({}));
    }
    std::size_t said(const std::string& message) const
    {
        return simulated.log.count(LogSink::system, LogLevel::defaultLevel, message);
    }
    std::size_t invalidations() const
    {
        return said("TYSilkpage checkinForSilkpageProcess connection invalidationHandler.");
    }
    std::size_t sluiceErrors() const
    {
        return simulated.log.countContaining("sluice error: checkinForSilkpageProcess:reply: - ");
    }
    /// Only the application's own connection is left, and no array was made.
    void expectNothingIsLeft() const
    {
        EXPECT_EQ(simulated.ipc.connectionCount(), connectionsBefore);
        EXPECT_EQ(handler->webcontentProcessConnections(), std::nullopt);
    }

    // Before the platform: calls that are still pending fail while it ends, and the failures are noted here.
    int replies = 0;
    std::vector<std::string> errors;
    SimulatedPlatform simulated;
    std::shared_ptr<TyphonDaemon> daemon = std::make_shared<TyphonDaemon>(simulated.platform);
    AuditToken hostToken;
    std::shared_ptr<Connection> host;
    std::shared_ptr<TyphonHandler> handler;
    std::size_t issuedBefore = 0;
    std::size_t connectionsBefore = 0;
};

TEST_F(WebContentTest, AContentProcessGetsTheHostsFontsWithGrantsOfItsOwn)
{
    addHost({"font-enumeration"});
    const auto content = addContent();
    checkIn(content->listen());
    EXPECT_EQ(content->pings, 1);
    ASSERT_EQ(content->received.size(), 1U);
    const auto& info = content->received[0].value();
    EXPECT_EQ(info.find("fontsInfo")->asDictionary()->size(), 2U);
    EXPECT_NE(info.find("extension"), nullptr);
    const auto issued = simulated.sandbox.issued();
    ASSERT_EQ(issued.size(), issuedBefore + 2);
    EXPECT_EQ(issued[issuedBefore].token, content->token);
    EXPECT_EQ(issued[issuedBefore + 1].token, content->token);
    EXPECT_EQ(replies, 1);
    EXPECT_EQ(said("TYSilkpage calling ping2"), 1U);
    EXPECT_EQ(sluiceErrors(), 0U);
}

TEST_F(WebContentTest, NothingIsLeftOnceTheContentProcessHasItsFonts)
{
    addHost({"font-enumeration"});
    const auto content = addContent();
    checkIn(content->listen());
    EXPECT_EQ(replies, 1);
    content->connections.clear();
    expectNothingIsLeft();
}

TEST_F(WebContentTest, AProvidersContentProcessSeesTheProvidersFonts)
{
    addHost({"system-installation"});
    const auto content = addContent();
    checkIn(content->listen());
    const auto& info = content->received.at(0).value();
    EXPECT_EQ(*info.find("fontsInfo"), PropertyList(Dictionary{{ownFont, entry}}));
    EXPECT_NE(info.find("extension.provider"), nullptr);
}

TEST_F(WebContentTest, IssuedFontsDoNotReachTheContentProcessOfAnApplicationThatIsNoProvider)
{
    // Its identifier is kept for providers only, and what was issued is found by the identifier.
    addHost({"app-usage"});
    const auto content = addContent();
    checkIn(content->listen());
    EXPECT_EQ(content->received.at(0), PropertyList(Dictionary{{"fontsInfo", Dictionary{}}}));
    EXPECT_EQ(replies, 1);
}

TEST_F(WebContentTest, AHostWithoutCapabilitiesStillCausesThePingAndTheContentProcessGetsNull)
{
    addHost({});
    const auto content = addContent();
    checkIn(content->listen());
    EXPECT_EQ(content->pings, 1);
    EXPECT_EQ(content->received, std::vector<std::optional<PropertyList>>{std::nullopt});
    EXPECT_EQ(replies, 1);
}

TEST_F(WebContentTest, AHostThatNeverCheckedInHasNoCapabilities)
{
    addHost({"font-enumeration"});
    const auto pair = simulated.connect(addProcess("com.example.other", {"font-enumeration"}),
                                        wire::typhonDaemonInterfaces());
    daemon->listener(*simulated.ipc.anonymousListener(), pair.accepted);
    host = pair.client;
    const auto content = addContent();
    checkIn(content->listen());
    EXPECT_EQ(content->received, std::vector<std::optional<PropertyList>>{std::nullopt});
}

TEST_F(WebContentTest, AContentProcessThatDiesBeforeItAnswersLeavesTheHostUnansweredAndNothingBehind)
{
    addHost({"font-enumeration"});
    const auto content = addContent();
    content->answersPing = false;
    checkIn(content->listen());
    EXPECT_EQ(content->pings, 1);
    EXPECT_EQ(invalidations(), 0U);
    simulated.processes.exit(content->token);
    simulated.ipc.endProcess(content->token);
    simulated.drain();
    EXPECT_EQ(invalidations(), 1U);
    EXPECT_EQ(sluiceErrors(), 1U);
    EXPECT_EQ(replies, 0);
    EXPECT_TRUE(errors.empty());
    expectNothingIsLeft();
}

TEST_F(WebContentTest, AContentProcessThatNeverAnswersKeepsTheHostWaitingAndNobodyElse)
{
    addHost({"font-enumeration"});
    const auto silent = addContent();
    silent->answersPing = false;
    checkIn(silent->listen());
    const auto deaf = addContent();
    deaf->answersFonts = false;
    checkIn(deaf->listen());
    EXPECT_EQ(replies, 0);
    const auto content = addContent();
    checkIn(content->listen());
    EXPECT_EQ(replies, 1);
    EXPECT_EQ(deaf->received.size(), 1U);
    // Late is not too late.
    silent->held.at(0)->reply({});
    deaf->held.at(0)->reply({});
    simulated.drain();
    EXPECT_EQ(silent->received.size(), 1U);
    EXPECT_EQ(replies, 3);
    expectNothingIsLeft();
}

TEST_F(WebContentTest, AHostThatIsGoneDoesNotMatterToItsContentProcess)
{
    addHost({"font-enumeration"});
    const auto content = addContent();
    content->answersPing = false;
    checkIn(content->listen());
    const std::weak_ptr<TyphonHandler> weak = handler;
    handler.reset();
    host->invalidate();
    simulated.drain();
    EXPECT_TRUE(weak.expired());
    content->held.at(0)->reply({});
    simulated.drain();
    EXPECT_EQ(content->received.size(), 1U);
    EXPECT_EQ(simulated.ipc.connectionCount(), connectionsBefore - 2);
}

TEST_F(WebContentTest, AContentProcessThatRefusesEndsTheExchange)
{
    addHost({"font-enumeration"});
    const auto refusing = addContent();
    refusing->refusesPing = true;
    checkIn(refusing->listen());
    EXPECT_EQ(sluiceErrors(), 1U);
    const auto choosy = addContent();
    choosy->refusesFonts = true;
    checkIn(choosy->listen());
    EXPECT_EQ(sluiceErrors(), 2U);
    EXPECT_EQ(replies, 0);
    expectNothingIsLeft();
}

TEST_F(WebContentTest, AContentProcessThatAnswersTwiceIsHeardOnce)
{
    // It does so in every test here.
    addHost({"font-enumeration"});
    const auto content = addContent();
    checkIn(content->listen());
    EXPECT_EQ(content->received.size(), 1U);
    EXPECT_EQ(replies, 1);
}

TEST_F(WebContentTest, AnEndpointThatLeadsNowhereIsSaidInTheSystemLog)
{
    addHost({"font-enumeration"});
    const auto content = addContent();
    const auto endpoint = content->listen();
    simulated.ipc.endProcess(content->token);
    checkIn(endpoint);
    EXPECT_EQ(invalidations(), 1U);
    EXPECT_EQ(sluiceErrors(), 1U);
    EXPECT_EQ(replies, 0);
    expectNothingIsLeft();
}

TEST_F(WebContentTest, TheListOfConnectionsStaysNullAfterAnyNumberOfCheckIns)
{
    addHost({"font-enumeration"});
    for (int number = 0; number < 5; ++number) {
        checkIn(addContent()->listen());
        EXPECT_EQ(handler->webcontentProcessConnections(), std::nullopt);
    }
    handler->addWebContentProcessConnection(host);
    EXPECT_EQ(handler->webcontentProcessConnections(), std::nullopt);
}

TEST_F(WebContentTest, TheHostGoesOnWhileItsContentProcessThinks)
{
    addHost({"font-enumeration"});
    const auto content = addContent();
    content->answersPing = false;
    checkIn(content->listen());
    int acknowledged = 0;
    host->call(
        wire::updatingUserFonts.interface, wire::updatingUserFonts.member, {},
        [&](const Arguments&) { return count(&acknowledged); }, nullptr);
    simulated.drain();
    EXPECT_EQ(acknowledged, 1);
}

}  // namespace
}  // namespace typhon
