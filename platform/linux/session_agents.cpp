#include "platform/linux/session_agents.h"

#include "platform/linux/audit_tokens.h"
#include "platform/linux/pidfd.h"
#include "platform/linux/terminal_foreground.h"

#include <algorithm>

#include <fmt/format.h>

// The agent draws what users take for the system's own question, so it is admitted by its signature, outside
// of any sandbox, and for people only. What it reports is believed as far as it proves it: a terminal by a
// descriptor that it can only have by opening that terminal, a process by a pidfd, never by a number.

namespace typhon {

namespace {

/// The user identifiers that people have, by the usual division.
constexpr uid_t firstPerson = 1000;
constexpr uid_t lastPerson = 60000;

IpcError denied(std::string why)
{
    return {ipc_errors::accessDenied, std::move(why)};
}

Task<void> noteEnd(std::function<void()> ended)
{
    ended();
    co_return;
}

}  // namespace

SessionAgents::SessionAgents(CodeSigning& codeSigning, Sandbox& sandbox, Log& log, uid_t ownUser)
    : codeSigning_(codeSigning), sandbox_(sandbox), log_(log), ownUser_(ownUser)
{}

SessionAgents::Error SessionAgents::objectionTo(const AuditToken& peer)
{
    const auto user = static_cast<uid_t>(peer.effectiveUser);
    const bool isPerson = user == 0 || user == ownUser_ || (user >= firstPerson && user <= lastPerson);
    if (peer == AuditToken{} || sandbox_.isSandboxed(peer)) {
        return denied("a session agent runs outside of any sandbox");
    }
    const auto task = codeSigning_.taskFromAuditToken(peer);
    if (!task || task->signingIdentifier != signingIdentifier) {
        return denied(std::string("a session agent is signed as ") + signingIdentifier);
    }
    return isPerson ? std::nullopt : Error(denied("a session agent belongs to somebody who can log in"));
}

SessionAgents::Error SessionAgents::registerAgent(const std::shared_ptr<Connection>& connection)
{
    const auto token = connection->auditToken();
    if (auto objection = objectionTo(token)) {
        TYLog_Error(log_, fmt::format("process {} may not register as the session agent: {}",
                                      token.processIdentifier, objection->message));
        return objection;
    }
    std::vector<Pending> again;
    {
        const std::lock_guard lock(mutex_);
        if (agent_) {
            return IpcError{ipc_errors::failed, fmt::format("process {} is the session agent already",
                                                            agent_->token.processIdentifier)};
        }
        agent_ = Agent{connection, token, {}, {}};
        std::ranges::copy_if(pending_, std::back_inserter(again),
                             [&](const auto& alert) { return alert.user == token.effectiveUser; });
    }
    TYLog(log_, fmt::format("process {} of user {} is the session agent", token.processIdentifier,
                            token.effectiveUser));
    for (const auto& pending : again) {
        send(connection, pending.number, pending.alert);
    }
    return std::nullopt;
}

void SessionAgents::leave(const Connection* connection)
{
    std::optional<Agent> gone;
    std::size_t left = 0;
    {
        const std::lock_guard lock(mutex_);
        if (isAgent(connection)) {
            gone.swap(agent_);
            left = static_cast<std::size_t>(std::ranges::count_if(
                pending_, [&](const auto& alert) { return alert.user == gone->token.effectiveUser; }));
        }
    }
    if (gone) {
        TYLog(log_, fmt::format("the session agent, process {}, is gone", gone->token.processIdentifier));
    }
    if (gone && left > 0) {
        TYLog_Error(log_, "the session agent is gone while a dialog was up: its request stays unanswered "
                          "until another agent of the same user shows it again");
    }
}

bool SessionAgents::isAgent(const Connection* connection) const
{
    return agent_ && agent_->connection.get() == connection;
}

SessionAgents::Reported SessionAgents::addTerminal(const Connection* from, int descriptor)
{
    const auto terminal = terminalOfDescriptor(descriptor);
    {
        const std::lock_guard lock(mutex_);
        if (!isAgent(from)) {
            return {0, denied("only the session agent reports terminals")};
        }
        if (!terminal) {
            return {0, IpcError{ipc_errors::invalidArguments,
                                "that is not a terminal opened for reading and writing"}};
        }
        if (agent_->terminals.size() >= mostTerminals && !agent_->terminals.contains(*terminal)) {
            return {0, IpcError{ipc_errors::limitsExceeded, "too many terminals are reported"}};
        }
        agent_->terminals.insert(*terminal);
    }
    TYLog_Debug(log_, fmt::format("the session agent shows terminal {}", *terminal));
    return {*terminal, std::nullopt};
}

SessionAgents::Error SessionAgents::removeTerminal(const Connection* from, std::int64_t number)
{
    const std::lock_guard lock(mutex_);
    if (!isAgent(from)) {
        return denied("only the session agent reports terminals");
    }
    std::erase_if(agent_->terminals, [&](std::uint32_t terminal) { return terminal == number; });
    return std::nullopt;
}

SessionAgents::Reported SessionAgents::addWindow(const Connection* from, int pidfd)
{
    const auto process = isPidfd(pidfd) ? tokenOfProcess(pidfd) : AuditToken{};
    const std::lock_guard lock(mutex_);
    if (!isAgent(from)) {
        return {0, denied("only the session agent reports windows")};
    }
    if (process == AuditToken{}) {
        return {0, IpcError{ipc_errors::invalidArguments, "that is not a pidfd of a running process"}};
    }
    if (process.effectiveUser != agent_->token.effectiveUser) {
        return {0, denied("that process belongs to another user")};
    }
    return insert(*agent_, {process.version, process.processInstance});
}

SessionAgents::Reported SessionAgents::insert(Agent& agent, const Window& window)
{
    if (agent.windows.size() >= mostWindows) {
        return {0, IpcError{ipc_errors::limitsExceeded, "too many windows are reported"}};
    }
    agent.windows.emplace(++lastWindow_, window);
    return {lastWindow_, std::nullopt};
}

SessionAgents::Error SessionAgents::removeWindow(const Connection* from, std::int64_t number)
{
    const std::lock_guard lock(mutex_);
    if (!isAgent(from)) {
        return denied("only the session agent reports windows");
    }
    agent_->windows.erase(number);
    return std::nullopt;
}

bool SessionAgents::isPresent() const
{
    const std::lock_guard lock(mutex_);
    return agent_.has_value();
}

bool SessionAgents::showsTerminalTo(std::uint32_t terminal, uid_t user) const
{
    const std::lock_guard lock(mutex_);
    return agent_ && agent_->token.effectiveUser == user && agent_->terminals.contains(terminal);
}

bool SessionAgents::showsWindowOf(const AuditToken& process) const
{
    const std::lock_guard lock(mutex_);
    const Window window{process.version, process.processInstance};
    return agent_ &&
           std::ranges::any_of(agent_->windows, [&](const auto& entry) { return entry.second == window; });
}

void SessionAgents::show(SessionAlert alert)
{
    std::shared_ptr<Connection> agent;
    std::uint64_t number = 0;
    {
        const std::lock_guard lock(mutex_);
        if (agent_ && pending_.size() < mostAlerts) {
            agent = agent_->connection;
            number = ++lastAlert_;
            pending_.push_back({number, static_cast<uid_t>(agent_->token.effectiveUser), alert});
        }
    }
    if (!agent) {
        TYLog_Error(log_, "an alert of " + alert.serviceName + " cannot appear: no session agent takes it");
        return;
    }
    send(agent, number, alert);
}

void SessionAgents::send(const std::shared_ptr<Connection>& agent, std::uint64_t number,
                         const SessionAlert& alert)
{
    agent->call(
        agentInterface, "showAlert",
        {PropertyList(alert.serviceName), PropertyList(alert.viewControllerClassName), alert.userInfo,
         alert.endpoint},
        [this, number](const Arguments&) { return noteEnd([this, number] { finish(number); }); },
        [this, number](const IpcError& error) { fail(number, error); });
}

void SessionAgents::finish(std::uint64_t number)
{
    const std::lock_guard lock(mutex_);
    std::erase_if(pending_, [&](const auto& pending) { return pending.number == number; });
}

void SessionAgents::fail(std::uint64_t number, const IpcError& error)
{
    // A lost agent is told of once, for all its alerts, when its connection has ended.
    if (error.name == ipc_errors::disconnected) {
        return;
    }
    TYLog_Error(log_, "the session agent does not show an alert: " + error.name + ": " + error.message);
    finish(number);
}

InterfaceDescriptions SessionAgents::agentInterfaces()
{
    static const auto descriptions = std::make_shared<const std::vector<InterfaceDescription>>(
        std::vector<InterfaceDescription>{{agentInterface, {{"showAlert", "ssa{sv}h", "", true}}}});
    return descriptions;
}

}  // namespace typhon
