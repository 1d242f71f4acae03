// One suite for every transport: what the core relies on, seen from both ends.

#include "ipc_test_service.h"
#include "ipc_worlds.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::Contains;
using testing::HasSubstr;
using testing::Not;

constexpr const char* serviceName = "com.vorlan.test";

struct WorldKind {
    const char* name;
    std::unique_ptr<IpcWorld> (*make)();
};

template <class World>
std::unique_ptr<IpcWorld> make()
{
    return std::make_unique<World>();
}

class IpcContract : public testing::TestWithParam<WorldKind> {
protected:
    IpcContract()
    {
        listener_ = world_->server().listenerForService(serviceName);
        listener_->setDelegate(delegate_);
        listener_->resume();
    }
    ~IpcContract() override
    {
        listener_->invalidate();
        for (const auto& connection : made_) {
            connection->invalidate();
        }
        made_.clear();
        state_.release.reset();
        state_.other.reset();
        world_.reset();
    }

    std::shared_ptr<Connection> connect(InterfaceDescriptions remote = serviceInterfaces())
    {
        return configured(world_->client().connectionToService(serviceName), std::move(remote));
    }
    std::shared_ptr<Connection> configured(std::shared_ptr<Connection> connection,
                                           InterfaceDescriptions remote)
    {
        connection->setRemoteObjectInterfaces(std::move(remote));
        connection->setExportedInterfaces(clientInterfaces());
        connection->setExportedObject(std::make_shared<TestClient>(notes_));
        connection->resume();
        made_.push_back(connection);
        return connection;
    }

    static Task<void> noteReply(Notes* notes, std::string label, Arguments results)
    {
        notes->add(label + textOf(results) + " at " + whoIsCurrent());
        co_return;
    }
    /// Notes "<member>: <reply> at <current process>" or "<member> failed: <error name>".
    void call(const std::shared_ptr<Connection>& connection, const std::string& member,
              Arguments arguments = {})
    {
        Notes* notes = &notes_;
        connection->call(
            serviceInterface, member, std::move(arguments),
            [notes, member](Arguments results) {
                return noteReply(notes, member + ": ", std::move(results));
            },
            [notes, member](const IpcError& error) { notes->add(member + " failed: " + error.name); });
    }
    void callText(const std::shared_ptr<Connection>& connection, const std::string& member,
                  const std::string& text)
    {
        call(connection, member, {PropertyList(text)});
    }
    void sendNote(const std::shared_ptr<Connection>& connection, const std::string& text)
    {
        Notes* notes = &notes_;
        connection->send(serviceInterface, "note", {PropertyList(text)},
                         [notes](const IpcError& error) { notes->add("note failed: " + error.name); });
    }
    static Task<void> awaitCall(std::shared_ptr<Connection> connection, std::string member,
                                Arguments arguments, std::int64_t timeout, Notes* notes, Arguments* results)
    {
        Task<CallResult> calling =
            connection->callAndWait(serviceInterface, member, std::move(arguments), timeout);
        CallResult result = co_await std::move(calling);
        if (result.results && results != nullptr) {
            *results = *result.results;
        }
        notes->add(result.results ? "awaited " + member + ": " + textOf(*result.results)
                                  : "awaited " + member + " failed: " + result.error.name);
    }
    void callAndWait(const std::shared_ptr<Connection>& connection, const std::string& member,
                     Arguments arguments = {}, std::int64_t timeout = 0, Arguments* results = nullptr)
    {
        clientQueue_->async(awaitCall(connection, member, std::move(arguments), timeout, &notes_, results));
    }

    bool waitFor(const std::string& note, std::size_t times = 1)
    {
        return world_->waitUntil(notes_, [&](const auto& notes) { return countOf(notes, note) >= times; });
    }
    std::string at(const AuditToken& token) const { return std::to_string(token.processIdentifier); }

    Notes notes_;
    std::unique_ptr<IpcWorld> world_ = GetParam().make();
    ServiceState state_{notes_, *world_, world_->queues().createSemaphore(0),
                        world_->queues().createSerialQueue("other")};
    std::shared_ptr<TestDelegate> delegate_ = std::make_shared<TestDelegate>(state_);
    std::shared_ptr<WorkQueue> clientQueue_ = world_->queues().createSerialQueue("client");
    std::shared_ptr<Listener> listener_;
    std::vector<std::shared_ptr<Connection>> made_;
};

INSTANTIATE_TEST_SUITE_P(Worlds, IpcContract,
                         testing::Values(WorldKind{"simulated_seed_1", make<SimulatedWorld<1>>},
                                         WorldKind{"simulated_seed_2", make<SimulatedWorld<2>>},
                                         WorldKind{"simulated_seed_3", make<SimulatedWorld<3>>},
                                         WorldKind{"simulated_seed_4", make<SimulatedWorld<4>>},
                                         WorldKind{"linux", make<LinuxWorld>}),
                         [](const auto& kind) { return std::string(kind.param.name); });

TEST_P(IpcContract, ACallIsAnsweredWithBothEndsKnown)
{
    const auto connection = connect();
    callText(connection, "echo", "hello");
    EXPECT_TRUE(waitFor("echo: hello at " + at(world_->serverToken())));
    EXPECT_THAT(notes_.all(), Contains("echo from " + at(world_->clientToken())));
    EXPECT_EQ(connection->auditToken(), world_->serverToken());
    EXPECT_EQ(currentConnection(), nullptr);
    EXPECT_EQ(currentAuditToken(), AuditToken{});
}

TEST_P(IpcContract, AnAwaitedCallGivesItsResults)
{
    callAndWait(connect(), "echo", {PropertyList("hello")});
    EXPECT_TRUE(waitFor("awaited echo: hello"));
}

TEST_P(IpcContract, EveryTypeTravelsBothWays)
{
    const PropertyList entry(
        PropertyList::Dictionary{{"b", true},
                                 {"d", 1.5},
                                 {"data", Data{{0, 1, 255}}},
                                 {"date", Date{-1.5}},
                                 {"i", std::int64_t{-7}},
                                 {"list", PropertyList::Array{1, "two", PropertyList::Array{}}},
                                 {"map", PropertyList::Dictionary{{"", PropertyList::Dictionary{}}}},
                                 {"s", "text"}});
    const Arguments sent{PropertyList(false),
                         PropertyList(std::int64_t{1} << 62),
                         PropertyList("x"),
                         arrayOfStrings({"a", "b"}),
                         entry,
                         PropertyList(PropertyList::Array{entry}),
                         PropertyList(PropertyList::Array{})};
    Arguments received;
    callAndWait(connect(), "all", sent, 0, &received);
    ASSERT_TRUE(waitFor("awaited all: ?"));
    EXPECT_EQ(received, sent);
}

TEST_P(IpcContract, MessagesOfOneConnectionAreHandledInOrder)
{
    const auto connection = connect();
    std::vector<std::string> expected;
    for (int number = 0; number < 40; ++number) {
        expected.push_back("n" + std::to_string(number));
        sendNote(connection, expected.back());
    }
    ASSERT_TRUE(waitFor("n39"));
    auto notes = notes_.all();
    std::erase_if(notes, [](const auto& note) { return note.front() != 'n'; });
    EXPECT_EQ(notes, expected);
}

TEST_P(IpcContract, ASuspendedHandlerHoldsItsOwnConnectionOnly)
{
    const auto held = connect();
    const auto free = connect();
    callText(held, "hold", "A");
    sendNote(held, "after A");
    ASSERT_TRUE(waitFor("holding A"));
    callText(free, "echo", "B");
    ASSERT_TRUE(waitFor("echo: B at " + at(world_->serverToken())));
    EXPECT_THAT(notes_.all(), Not(Contains("after A")));
    state_.release->signal();
    ASSERT_TRUE(waitFor("after A"));
    ASSERT_TRUE(waitFor("hold: A at " + at(world_->serverToken())));
    auto notes = notes_.all();
    EXPECT_LT(std::find(notes.begin(), notes.end(), "released A"),
              std::find(notes.begin(), notes.end(), "after A"));
}

TEST_P(IpcContract, AReplyMayComeFromAnotherQueue)
{
    callText(connect(), "relay", "word");
    ASSERT_TRUE(waitFor("relay: word relayed at " + at(world_->serverToken())));
    EXPECT_THAT(notes_.all(), Contains("awaited: " + at(world_->clientToken())));
    EXPECT_THAT(notes_.all(), Contains("posted: nobody"));
}

TEST_P(IpcContract, OnlyTheFirstAnswerCounts)
{
    const auto connection = connect();
    call(connection, "twice");
    callText(connection, "echo", "end");
    ASSERT_TRUE(waitFor("echo: end at " + at(world_->serverToken())));
    EXPECT_THAT(notes_.all(), Contains("twice: first at " + at(world_->serverToken())));
    EXPECT_THAT(notes_.all(), Not(Contains(HasSubstr("second"))));
    EXPECT_THAT(notes_.all(), Not(Contains(HasSubstr("twice failed"))));
}

TEST_P(IpcContract, ADroppedCallIsNeverAnsweredAndFailsWithItsConnection)
{
    const auto connection = connect();
    call(connection, "never");
    callText(connection, "echo", "end");
    ASSERT_TRUE(waitFor("echo: end at " + at(world_->serverToken())));
    EXPECT_THAT(notes_.all(), Not(Contains(HasSubstr("never"))));
    connection->invalidate();
    ASSERT_TRUE(waitFor(std::string("never failed: ") + ipc_errors::disconnected));
    ASSERT_TRUE(waitFor("server connection invalid"));
    EXPECT_EQ(countOf(notes_.all(), std::string("never failed: ") + ipc_errors::disconnected), 1U);
}

TEST_P(IpcContract, FailuresHaveTheirNames)
{
    const auto odd = std::make_shared<const std::vector<InterfaceDescription>>(
        std::vector<InterfaceDescription>{{serviceInterface,
                                           {{"echo", "x", "s"},
                                            {"missing", "", "s"},
                                            {"fail", "", "s"},
                                            {"refuse", "", "s"},
                                            {"misfit", "", "s"},
                                            {"twice", "", "x"}}}});
    const auto connection = connect(odd);
    call(connection, "echo", {PropertyList(5)});
    EXPECT_TRUE(waitFor(std::string("echo failed: ") + ipc_errors::invalidArguments));
    call(connection, "echo", {PropertyList("does not fit the own description")});
    EXPECT_TRUE(waitFor(std::string("echo failed: ") + ipc_errors::invalidArguments, 2));
    call(connection, "missing");
    EXPECT_TRUE(waitFor(std::string("missing failed: ") + ipc_errors::unknownMethod));
    call(connection, "undescribed");
    EXPECT_TRUE(waitFor(std::string("undescribed failed: ") + ipc_errors::unknownMethod));
    call(connection, "fail");
    EXPECT_TRUE(waitFor(std::string("fail failed: ") + ipc_errors::failed));
    call(connection, "refuse");
    EXPECT_TRUE(waitFor(std::string("refuse failed: ") + ipc_errors::accessDenied));
    call(connection, "misfit");
    EXPECT_TRUE(waitFor(std::string("misfit failed: ") + ipc_errors::failed));
    call(connection, "twice");
    EXPECT_TRUE(waitFor(std::string("twice failed: ") + ipc_errors::failed)) << "a reply of unexpected types";
    sendNote(connection, "not described either");
    EXPECT_TRUE(waitFor(std::string("note failed: ") + ipc_errors::unknownMethod));
}

TEST_P(IpcContract, TheServiceCallsItsClients)
{
    const auto connection = connect();
    callText(connection, "callBack", "news");
    ASSERT_TRUE(waitFor("told news"));
    ASSERT_TRUE(waitFor("callBack: told at " + at(world_->serverToken())));
}

TEST_P(IpcContract, AnAwaitedCallEndsAtItsTimeout)
{
    const auto connection = connect();
    call(connection, "askBack");
    world_->passTime(std::chrono::seconds(1));
    EXPECT_TRUE(waitFor(std::string("askBack failed: ") + ipc_errors::timeout));
}

TEST_P(IpcContract, AnAwaitedCallEndsWithItsConnection)
{
    const auto connection = connect();
    callAndWait(connection, "never");
    callText(connection, "echo", "end");
    ASSERT_TRUE(waitFor("echo: end at " + at(world_->serverToken())));
    connection->invalidate();
    EXPECT_TRUE(waitFor(std::string("awaited never failed: ") + ipc_errors::disconnected));
}

TEST_P(IpcContract, InvalidationReachesBothEndsOnce)
{
    const auto connection = connect();
    Notes* notes = &notes_;
    connection->setInvalidationHandler([notes] { notes->add("client connection invalid"); });
    callText(connection, "echo", "up");
    ASSERT_TRUE(waitFor("echo: up at " + at(world_->serverToken())));
    connection->invalidate();
    connection->invalidate();
    ASSERT_TRUE(waitFor("client connection invalid"));
    ASSERT_TRUE(waitFor("server connection invalid"));
    ASSERT_TRUE(waitFor("service gone"));
    callText(connection, "echo", "late");
    ASSERT_TRUE(waitFor(std::string("echo failed: ") + ipc_errors::disconnected));
    EXPECT_EQ(countOf(notes_.all(), "client connection invalid"), 1U);
    EXPECT_EQ(countOf(notes_.all(), "server connection invalid"), 1U);
}

TEST_P(IpcContract, MessagesBeforeTheEndAreStillHandled)
{
    const auto connection = connect();
    callText(connection, "echo", "up");
    ASSERT_TRUE(waitFor("echo: up at " + at(world_->serverToken())));
    sendNote(connection, "last words");
    connection->invalidate();
    ASSERT_TRUE(waitFor("server connection invalid"));
    auto notes = notes_.all();
    ASSERT_THAT(notes, Contains("last words"));
    EXPECT_LT(std::find(notes.begin(), notes.end(), "last words"),
              std::find(notes.begin(), notes.end(), "server connection invalid"));
}

TEST_P(IpcContract, AServiceConnectionIsInterruptedAndConnectsAnew)
{
    const auto connection = connect();
    Notes* notes = &notes_;
    connection->setInterruptionHandler([notes] { notes->add("interrupted"); });
    connection->setInvalidationHandler([notes] { notes->add("client connection invalid"); });
    callText(connection, "echo", "one");
    ASSERT_TRUE(waitFor("echo: one at " + at(world_->serverToken())));
    call(connection, "never");
    callText(connection, "hold", "x");
    ASSERT_TRUE(waitFor("holding x"));
    delegate_->latest.lock()->invalidate();
    ASSERT_TRUE(waitFor("interrupted"));
    EXPECT_TRUE(waitFor(std::string("never failed: ") + ipc_errors::disconnected));
    EXPECT_TRUE(waitFor(std::string("hold failed: ") + ipc_errors::disconnected));
    callText(connection, "echo", "two");
    ASSERT_TRUE(waitFor("echo: two at " + at(world_->serverToken())));
    EXPECT_EQ(countOf(notes_.all(), "accepted " + at(world_->clientToken())), 2U);
    EXPECT_THAT(notes_.all(), Not(Contains("client connection invalid")));
    state_.release->signal();
    ASSERT_TRUE(waitFor("server connection invalid"));
}

TEST_P(IpcContract, ARefusedConnectionFailsItsCalls)
{
    delegate_->refuses = true;
    callText(connect(), "echo", "x");
    ASSERT_TRUE(waitFor("refused"));
    EXPECT_TRUE(waitFor(std::string("echo failed: ") + ipc_errors::disconnected));
}

TEST_P(IpcContract, WithoutAListenerCallsFail)
{
    listener_->invalidate();
    const auto connection = connect();
    callText(connection, "echo", "x");
    EXPECT_TRUE(waitFor(std::string("echo failed: ") + ipc_errors::disconnected));
    sendNote(connection, "x");
    EXPECT_TRUE(waitFor(std::string("note failed: ") + ipc_errors::disconnected));
}

TEST_P(IpcContract, ConnectionsOutliveTheirListener)
{
    const auto connection = connect();
    callText(connection, "echo", "one");
    ASSERT_TRUE(waitFor("echo: one at " + at(world_->serverToken())));
    listener_->invalidate();
    callText(connection, "echo", "two");
    EXPECT_TRUE(waitFor("echo: two at " + at(world_->serverToken())));
}

TEST_P(IpcContract, AnEndpointLeadsToItsListener)
{
    const auto clients = std::make_shared<TestClientDelegate>(notes_);
    const auto anonymous = world_->client().anonymousListener();
    anonymous->setDelegate(clients);
    anonymous->resume();
    ASSERT_NE(anonymous->endpoint(), nullptr);
    EXPECT_EQ(listener_->endpoint(), nullptr);
    const auto connection = connect();
    // Reusable: each holder, and each use, is a connection of its own.
    for (std::size_t times = 1; times <= 2; ++times) {
        call(connection, "ping", {anonymous->endpoint()});
        EXPECT_TRUE(waitFor("ping: who? me at " + at(world_->serverToken()), times));
        EXPECT_TRUE(waitFor("endpoint connection invalid", times));
    }
    EXPECT_THAT(notes_.all(), Contains("endpoint peer: " + at(world_->clientToken())));
    anonymous->invalidate();
}

TEST_P(IpcContract, AnEndpointWhoseListenerIsGoneLeadsNowhere)
{
    const auto anonymous = world_->client().anonymousListener();
    anonymous->resume();
    const auto endpoint = anonymous->endpoint();
    anonymous->invalidate();
    call(connect(), "ping", {endpoint});
    EXPECT_TRUE(waitFor(std::string("ping failed: ") + ipc_errors::disconnected));
    EXPECT_TRUE(waitFor("endpoint connection invalid"));
}

}  // namespace
}  // namespace typhon
