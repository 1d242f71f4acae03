#include "testing/request_world.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace testing_aid;
using namespace std::chrono_literals;
using Names = std::vector<std::string>;

const std::string alphaPath = fontFiles + "com.example.foundry/alpha.ttf";
const std::string boldPath = fontFiles + "com.example.foundry/bold.ttf";
const std::string betaPath = fontFiles + "com.example.foundry/beta.ttf";
const std::string invalidated = "requestFonts:forClient: connection invalidated.";

/// How an application behaves to which fonts are offered.
struct Behaviour {
    bool answersPing = true;
    bool answersActivation = true;
    bool activates = true;
};

/// An application that listens for what the font picker hands it.
class PickersClient final : public ListenerDelegate,
                            public ExportedObject,
                            public std::enable_shared_from_this<PickersClient> {
public:
    PickersClient(Ipc& ipc, Behaviour behaviour) : behaviour_(behaviour), listener_(ipc.anonymousListener())
    {}

    void listen()
    {
        listener_->setDelegate(weak_from_this());
        listener_->resume();
    }
    std::shared_ptr<ListenerEndpoint> endpoint() const { return listener_->endpoint(); }
    bool listener(Listener&, std::shared_ptr<Connection> shouldAcceptNewConnection) override
    {
        ++connections;
        shouldAcceptNewConnection->setExportedInterfaces(wire::typhonFontPickerClientSupportInterfaces());
        shouldAcceptNewConnection->setExportedObject(shared_from_this());
        shouldAcceptNewConnection->resume();
        return true;
    }
    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        const auto argument = std::get<PropertyList>(call->arguments().at(0));
        Arguments results;
        if (call->member() == wire::pingFontPickerClient.member) {
            pings.push_back(argument);
            results.emplace_back(PropertyList("here"));
            answer(call, behaviour_.answersPing, std::move(results));
        } else {
            offers.push_back(argument);
            results.emplace_back(PropertyList(behaviour_.activates));
            answer(call, behaviour_.answersActivation, std::move(results));
        }
        co_return;
    }

    int connections = 0;
    std::vector<PropertyList> pings;
    std::vector<PropertyList> offers;

private:
    void answer(const std::shared_ptr<IncomingCall>& call, bool isAnswered, Arguments results)
    {
        if (isAnswered) {
            call->reply(std::move(results));
        } else {
            held_.push_back(call);
        }
    }

    const Behaviour behaviour_;
    const std::shared_ptr<Listener> listener_;
    std::vector<std::shared_ptr<IncomingCall>> held_;
};

class FontPickerRequestsTest : public testing::Test {
protected:
    FontPickerRequestsTest()
    {
        world.install(alphaPath, {{"Alpha-Regular", "Alpha"}});
        world.install(boldPath, {{"Alpha-Bold", "Alpha"}}, true);
        world.install(betaPath, {{"Beta-Regular", "Beta"}});
    }

    std::shared_ptr<PickersClient> listenAs(const AuditToken& token, Behaviour behaviour = {})
    {
        auto client = std::make_shared<PickersClient>(*world.simulated.ipc.process(token), behaviour);
        client->listen();
        return client;
    }
    /// The picker's call; gives the replies.
    std::shared_ptr<std::vector<bool>> request(const std::string& name,
                                               std::shared_ptr<ListenerEndpoint> endpoint)
    {
        auto replies = std::make_shared<std::vector<bool>>();
        queue->async(world.fontPickerRequests.requestFonts(
            name, std::move(endpoint), [replies](bool reply) { replies->push_back(reply); }));
        world.simulated.drain();
        return replies;
    }
    std::size_t systemLogCount(const std::string& message)
    {
        return world.simulated.log.count(LogSink::system, LogLevel::defaultLevel, message);
    }
    Names issued(const std::string& identifier)
    {
        return world.ledger.issuedFontFilePathsForIdentifier(identifier);
    }

    RequestWorld world;
    AuditToken application = world.addApplication("com.example.app");
    std::shared_ptr<WorkQueue> queue = world.simulated.queues.createSerialQueue("connection of the picker");
    const std::vector<bool> yes{true};
    const std::vector<bool> no{false};
};

TEST_F(FontPickerRequestsTest, AnUnknownNameIsFalseWithoutACallToTheClient)
{
    const auto client = listenAs(application);
    EXPECT_EQ(*request("Gamma-Regular", client->endpoint()), no);
    EXPECT_TRUE(client->pings.empty());
    EXPECT_TRUE(client->offers.empty());
    EXPECT_EQ(systemLogCount(invalidated), 1U);
    EXPECT_EQ(world.simulated.ipc.connectionCount(), 0U);
}

TEST_F(FontPickerRequestsTest, TheWholeFamilyIsHandedOverWithGrantsForTheClientAndRecorded)
{
    const auto client = listenAs(application);
    EXPECT_EQ(*request("Alpha-Regular", client->endpoint()), yes);
    EXPECT_EQ(client->pings, std::vector<PropertyList>{""});
    ASSERT_EQ(client->offers.size(), 1U);
    const auto& fonts = *client->offers[0].asDictionary();
    ASSERT_EQ(fonts.size(), 2U);
    EXPECT_TRUE(fonts.contains(alphaPath) && fonts.contains(boldPath));
    for (const auto& extension : world.simulated.sandbox.issued()) {
        EXPECT_EQ(extension.token, application);
    }
    EXPECT_NE(fonts.find(alphaPath)->second.find("data"), nullptr);
    EXPECT_EQ(issued("com.example.app"), (Names{alphaPath, boldPath}));
    EXPECT_EQ(world.simulated.ipc.connectionCount(), 0U);
    EXPECT_EQ(systemLogCount(invalidated), 1U);
}

TEST_F(FontPickerRequestsTest, TheClientsRefusalIsPassedOnOnceAndTheFontsAreRecorded)
{
    const auto client = listenAs(application, {.activates = false});
    EXPECT_EQ(*request("Alpha-Regular", client->endpoint()), no);
    EXPECT_EQ(issued("com.example.app"), (Names{alphaPath, boldPath}));
}

TEST_F(FontPickerRequestsTest, AClientThatNeverAnswersThePingIsGivenUpAfterTwentyFiveSeconds)
{
    const auto client = listenAs(application, {.answersPing = false});
    const auto replies = request("Alpha-Regular", client->endpoint());
    world.advance(24999ms);
    EXPECT_TRUE(replies->empty());
    world.advance(1ms);
    EXPECT_EQ(*replies, no);
    EXPECT_TRUE(client->offers.empty());
    EXPECT_EQ(systemLogCount("sluice error: requestFonts:forClient:reply: - "
                             "org.freedesktop.DBus.Error.Timeout: no reply in time"),
              1U);
    EXPECT_EQ(issued("com.example.app"), Names{});
    EXPECT_EQ(world.simulated.ipc.connectionCount(), 0U);
}

TEST_F(FontPickerRequestsTest, AClientThatNeverAnswersTheActivationIsFalseAfterTwentyFiveSeconds)
{
    const auto client = listenAs(application, {.answersActivation = false});
    const auto replies = request("Alpha-Regular", client->endpoint());
    EXPECT_EQ(client->offers.size(), 1U);
    world.advance(25s);
    EXPECT_EQ(*replies, no);
    EXPECT_EQ(issued("com.example.app"), (Names{alphaPath, boldPath}));
}

TEST_F(FontPickerRequestsTest, AClientThatVanishesIsFalseAtOnce)
{
    const auto client = listenAs(application, {.answersActivation = false});
    const auto replies = request("Alpha-Regular", client->endpoint());
    world.simulated.processes.exit(application);
    world.simulated.ipc.endProcess(application);
    world.simulated.drain();
    EXPECT_EQ(*replies, no);
    EXPECT_EQ(systemLogCount(invalidated), 1U);
    EXPECT_EQ(world.simulated.log.countContaining("sluice error: requestFonts:forClient:reply: - "), 1U);
    EXPECT_EQ(issued("com.example.app"), Names{});
}

TEST_F(FontPickerRequestsTest, NobodyBehindTheEndpointIsFalse)
{
    const auto client = listenAs(application);
    const auto endpoint = client->endpoint();
    world.simulated.ipc.endProcess(application);
    EXPECT_EQ(*request("Alpha-Regular", endpoint), no);
    EXPECT_EQ(*request("Alpha-Regular", std::make_shared<TransferredFile>()), no);
    EXPECT_EQ(systemLogCount(invalidated), 2U);
}

TEST_F(FontPickerRequestsTest, FontsThatTheClientCanReadByItselfAreNotOffered)
{
    world.simulated.processes.set(
        application, {.signingIdentifier = "com.example.app", .readablePaths = {alphaPath, boldPath}});
    const auto client = listenAs(application);
    EXPECT_EQ(*request("Alpha-Regular", client->endpoint()), no);
    EXPECT_EQ(client->pings.size(), 1U);
    EXPECT_TRUE(client->offers.empty());
}

TEST_F(FontPickerRequestsTest, AClientWithoutAnIdentifierGetsItsFontsAndNoRecord)
{
    const auto nameless = world.simulated.processes.add({});
    const auto client = listenAs(nameless);
    EXPECT_EQ(*request("Alpha-Regular", client->endpoint()), yes);
    EXPECT_EQ(world.simulated.preferences.durableValue("issues"), std::nullopt);
}

TEST_F(FontPickerRequestsTest, TheGateIsNotAskedAndNothingIsCountedOrReported)
{
    RequestingClient waiting(world, world.addApplication("com.example.other"));
    waiting.request({family("Gamma")});
    const auto offered = world.simulated.analytics.offered();
    const auto client = listenAs(application);
    EXPECT_EQ(*request("Alpha-Regular", client->endpoint()), yes);
    EXPECT_EQ(world.simulated.analytics.offered(), offered);
    EXPECT_EQ(world.fontRequests.gate().inFlight(), 1);
    EXPECT_EQ(world.resolved(), 0);
}

}  // namespace
}  // namespace typhon
