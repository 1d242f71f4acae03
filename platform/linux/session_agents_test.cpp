// The session-agent service over real connections.

#include "platform/linux/audit_tokens.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/linux_ipc.h"
#include "platform/linux/linux_process_lifecycle.h"
#include "platform/linux/linux_remote_alerts.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/pidfd.h"
#include "platform/linux/session_agent_service.h"
#include "platform/linux/session_agents.h"
#include "testing/child_process.h"
#include "testing/ipc_service.h"
#include "testing/pseudo_terminal.h"

#include <chrono>
#include <future>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::ChildProcess;
using testing::PseudoTerminal;
using testing::remain;

struct Identity final : CodeSigning, Sandbox {
    std::optional<CodeSigningTask> taskFromAuditToken(const AuditToken&) override
    {
        return CodeSigningTask{signingIdentifier, {}};
    }
    bool isSandboxed(const AuditToken&) override { return isConfined; }
    bool mayRead(const AuditToken&, const std::string&) override { return false; }
    std::optional<std::string> issueReadExtension(const AuditToken&, const std::string&) override
    {
        return std::nullopt;
    }
    std::optional<std::string> signingIdentifier = SessionAgents::signingIdentifier;
    bool isConfined = false;
};

/// What an agent exports: notes what it is to show, and answers when the test says so.
class AgentObject final : public ExportedObject {
public:
    explicit AgentObject(Log& log) : log_(log) {}
    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        const auto& info = std::get<PropertyList>(call->arguments().at(2));
        const auto* text = info.find("text");
        {
            const std::lock_guard lock(mutex_);
            up_.push_back(call);
        }
        TYLog(log_, "showing " + (text == nullptr ? std::string("?") : *text->asString()));
        co_return;
    }
    void endAll()
    {
        const std::lock_guard lock(mutex_);
        for (const auto& call : up_) {
            call->reply({});
        }
        up_.clear();
    }

private:
    Log& log_;
    std::mutex mutex_;
    std::vector<std::shared_ptr<IncomingCall>> up_;
};

Task<void> keepResults(std::shared_ptr<std::promise<CallResult>> promise, Arguments results)
{
    promise->set_value({std::move(results), {}});
    co_return;
}

/// A process that connects as an agent does; here it is the test itself.
class Agent {
public:
    Agent(Ipc& ipc, Log& log)
        : object(std::make_shared<AgentObject>(log)),
          connection_(ipc.connectionToService(SessionAgentService::serviceName))
    {
        connection_->setExportedInterfaces(SessionAgents::agentInterfaces());
        connection_->setExportedObject(object);
        connection_->setRemoteObjectInterfaces(SessionAgentService::interfaces());
        connection_->resume();
    }
    ~Agent() { connection_->invalidate(); }
    Agent(const Agent&) = delete;
    Agent& operator=(const Agent&) = delete;

    CallResult call(const char* member, Arguments arguments = {})
    {
        const auto promise = std::make_shared<std::promise<CallResult>>();
        auto outcome = promise->get_future();
        connection_->call(
            SessionAgentService::interfaceName, member, std::move(arguments),
            [promise](Arguments results) { return keepResults(promise, std::move(results)); },
            [promise](const IpcError& error) {
                promise->set_value({std::nullopt, error});
            });
        const bool isAnswered = outcome.wait_for(std::chrono::seconds(30)) == std::future_status::ready;
        return isAnswered ? outcome.get() : CallResult{std::nullopt, {"no answer", ""}};
    }
    CallResult pass(const char* member, int descriptor)
    {
        const std::shared_ptr<TransferredFile> file =
            std::make_shared<LinuxTransferredFile>(FileDescriptor(::fcntl(descriptor, F_DUPFD_CLOEXEC, 3)));
        return call(member, {file});
    }

    const std::shared_ptr<AgentObject> object;

private:
    std::shared_ptr<Connection> connection_;
};

struct SessionAgentsTest : ::testing::Test {
    TestFolder folder;
    const RootDirectory root{folder.path};
    AwaitedLog log;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    Identity identity;
    ConfinementProbe probe;
    SessionAgents agents{identity, identity, log, ::geteuid()};
    LinuxProcessLifecycle lifecycle{agents, probe};
    LinuxRemoteAlerts alerts{agents};
    const std::shared_ptr<SessionAgentService> service = std::make_shared<SessionAgentService>(agents);
    LinuxIpc ipc{pool, queues, log, root, tokenOfPeer};
    LinuxIpc client{pool, queues, log, root, tokenOfPeer, IpcLimits{}, EndpointHandshake::client};
    std::shared_ptr<Listener> listener = startSessionAgentService(ipc, service);

    // The end of a connection may still be handled.
    ~SessionAgentsTest() override { pool.stop(); }

    bool isVisible(const AuditToken& process)
    {
        const auto state = lifecycle.currentState(LWSProcessIdentifier::identifierWithPid(process));
        return state && state->endowmentNamespaces.contains(visibilityEndowmentNamespace);
    }
    void show(const std::string& text)
    {
        const auto endpoint = ipc.anonymousListener();
        alerts.newHandle({"service", "Controller"}, {endpoint->endpoint()})
            ->activateWithContext({PropertyList::Dictionary{{"text", text}}});
    }
};

TEST_F(SessionAgentsTest, WithoutAnAgentNoAlertCanAppearAndNobodyIsVisible)
{
    EXPECT_FALSE(alerts.isDefinitionClassAvailable());
    const ChildProcess child(remain);
    ASSERT_EQ(child.read(), "r");
    EXPECT_FALSE(isVisible(child.token()));
    show("lost");
    EXPECT_TRUE(log.waitFor("an alert of service cannot appear"));
}

TEST_F(SessionAgentsTest, OnlyASignedProgramOutsideOfSandboxesMayRegister)
{
    Agent agent(client, log);
    identity.isConfined = true;
    EXPECT_EQ(agent.call("register").error.name, ipc_errors::accessDenied);
    identity.isConfined = false;
    for (const auto& name : {std::optional<std::string>(), std::optional<std::string>("org.example.app")}) {
        identity.signingIdentifier = name;
        EXPECT_EQ(agent.call("register").error.name, ipc_errors::accessDenied);
    }
    EXPECT_EQ(log.countContaining("may not register as the session agent"), 3U);
    EXPECT_FALSE(alerts.isDefinitionClassAvailable());
    identity.signingIdentifier = SessionAgents::signingIdentifier;
    EXPECT_TRUE(agent.call("register").results);
    EXPECT_TRUE(alerts.isDefinitionClassAvailable());
}

TEST_F(SessionAgentsTest, ThereIsOneAtATime)
{
    auto first = std::make_unique<Agent>(client, log);
    Agent second(client, log);
    ASSERT_TRUE(first->call("register").results);
    EXPECT_EQ(first->call("register").error.name, ipc_errors::failed);
    EXPECT_EQ(second.call("register").error.name, ipc_errors::failed);
    first.reset();
    ASSERT_TRUE(log.waitFor("is gone"));
    EXPECT_FALSE(alerts.isDefinitionClassAvailable());
    EXPECT_TRUE(second.call("register").results);
}

TEST_F(SessionAgentsTest, OnlyTheAgentReports)
{
    Agent other(client, log);
    const PseudoTerminal terminal;
    const auto self = openPidfd(::getpid());
    EXPECT_EQ(other.pass("addTerminal", terminal.theirs.get()).error.name, ipc_errors::accessDenied);
    EXPECT_EQ(other.pass("addWindow", self.get()).error.name, ipc_errors::accessDenied);
    EXPECT_EQ(other.call("removeTerminal", {PropertyList(1)}).error.name, ipc_errors::accessDenied);
    EXPECT_EQ(other.call("removeWindow", {PropertyList(1)}).error.name, ipc_errors::accessDenied);
}

TEST_F(SessionAgentsTest, WhatStandsInAReportedTerminalIsVisibleUntilItIsTakenBack)
{
    const PseudoTerminal terminal;
    const ChildProcess child([&terminal](int stream) {
        terminal.becomeLeader();
        remain(stream);
    });
    ASSERT_EQ(child.read(), "r");
    auto agent = std::make_unique<Agent>(client, log);
    ASSERT_TRUE(agent->call("register").results);
    EXPECT_FALSE(isVisible(child.token()));
    const auto reported = agent->pass("addTerminal", terminal.theirs.get());
    ASSERT_TRUE(reported.results) << reported.error.message;
    EXPECT_TRUE(isVisible(child.token()));
    ASSERT_TRUE(agent->call("removeTerminal", *reported.results).results);
    EXPECT_FALSE(isVisible(child.token()));

    ASSERT_TRUE(agent->pass("addTerminal", terminal.theirs.get()).results);
    EXPECT_TRUE(isVisible(child.token()));
    agent.reset();
    ASSERT_TRUE(log.waitFor("is gone"));
    EXPECT_FALSE(isVisible(child.token()));
}

TEST_F(SessionAgentsTest, AProcessWithAReportedWindowIsVisibleUntilItEnds)
{
    ChildProcess child(remain);
    ASSERT_EQ(child.read(), "r");
    Agent agent(client, log);
    ASSERT_TRUE(agent.call("register").results);
    const auto reported = agent.pass("addWindow", child.pidfd());
    ASSERT_TRUE(reported.results) << reported.error.message;
    const auto token = child.token();
    EXPECT_TRUE(isVisible(token));
    ASSERT_TRUE(agent.call("removeWindow", *reported.results).results);
    EXPECT_FALSE(isVisible(token));
    ASSERT_TRUE(agent.pass("addWindow", child.pidfd()).results);
    child.end();
    EXPECT_FALSE(isVisible(token));
    EXPECT_FALSE(lifecycle.currentState(LWSProcessIdentifier::identifierWithPid(token)));
}

TEST_F(SessionAgentsTest, AnythingElseIsNoTerminalAndNoWindow)
{
    Agent agent(client, log);
    ASSERT_TRUE(agent.call("register").results);
    const FileDescriptor null(::open("/dev/null", O_RDWR | O_CLOEXEC));
    ChildProcess gone(remain);
    ASSERT_EQ(gone.read(), "r");
    gone.end();
    EXPECT_EQ(agent.pass("addTerminal", null.get()).error.name, ipc_errors::invalidArguments);
    EXPECT_EQ(agent.pass("addWindow", null.get()).error.name, ipc_errors::invalidArguments);
    EXPECT_EQ(agent.pass("addWindow", gone.pidfd()).error.name, ipc_errors::invalidArguments);
}

TEST_F(SessionAgentsTest, AnAlertThatItsAgentLeftUnfinishedIsShownByTheNextOne)
{
    auto first = std::make_unique<Agent>(client, log);
    ASSERT_TRUE(first->call("register").results);
    show("one");
    ASSERT_TRUE(log.waitFor("showing one"));
    first.reset();
    ASSERT_TRUE(log.waitFor("is gone while a dialog was up"));

    auto second = std::make_unique<Agent>(client, log);
    ASSERT_TRUE(second->call("register").results);
    ASSERT_TRUE(log.waitFor("showing one", 2));
    second->object->endAll();
    // Answered on the same connection after the end of the alert.
    ASSERT_FALSE(second->call("register").results);
    second.reset();
    ASSERT_TRUE(log.waitFor(", is gone", 2));
    // Whoever logs that goes on to log the other.
    pool.stop();
    EXPECT_EQ(log.countContaining("is gone while a dialog was up"), 1U);
}

}  // namespace
}  // namespace typhon
