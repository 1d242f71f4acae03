#pragma once

#include "platform/audit_token.h"
#include "platform/code_signing.h"
#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/property_list.h"
#include "platform/sandbox.h"

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace typhon {

/// One alert, as the session agent gets it.
struct SessionAlert {
    std::string serviceName;
    std::string viewControllerClassName;
    PropertyList userInfo;
    std::shared_ptr<ListenerEndpoint> endpoint;
};

/// The session agent, if there is one: what it says that its user sees, and the alerts that it has up. It is
/// a connection; when that ends, so does all that it said. An alert that its agent did not bring to an end is
/// shown again by the next agent of the same user. Any thread.
class SessionAgents {
public:
    static constexpr const char* signingIdentifier = "com.vorlan.FontInstallViewService";
    static constexpr const char* agentInterface = "com.vorlan.typhond.SessionAgent";
    static constexpr std::size_t mostTerminals = 256;
    static constexpr std::size_t mostWindows = 1024;
    static constexpr std::size_t mostAlerts = 64;

    using Error = std::optional<IpcError>;
    /// What something that was reported goes by from then on, or why it was not taken.
    struct Reported {
        std::int64_t number = 0;
        Error error;
    };

    /// All of them outlive this. `ownUser`: the user that the daemon runs as.
    SessionAgents(CodeSigning& codeSigning, Sandbox& sandbox, Log& log, uid_t ownUser);

    /// Makes the process behind a connection the agent. Null on success.
    Error registerAgent(const std::shared_ptr<Connection>& connection);
    /// The connection has ended.
    void leave(const Connection* connection);

    /// What the agent shows: terminals, of which it passes open descriptors, and processes with a mapped
    /// window, of which it passes pidfds. The descriptors stay the caller's. Taken back by their numbers.
    Reported addTerminal(const Connection* from, int descriptor);
    Error removeTerminal(const Connection* from, std::int64_t number);
    Reported addWindow(const Connection* from, int pidfd);
    Error removeWindow(const Connection* from, std::int64_t number);

    bool isPresent() const;
    /// Whether the agent is `user`'s and reports that terminal (a device number).
    bool showsTerminalTo(std::uint32_t terminal, uid_t user) const;
    bool showsWindowOf(const AuditToken& process) const;

    /// Has the agent show an alert; logged when there is no agent any more.
    void show(SessionAlert alert);

    /// What may be called on an agent.
    static InterfaceDescriptions agentInterfaces();

private:
    /// A process instance, whatever program it runs.
    using Window = std::pair<std::uint32_t, std::uint64_t>;
    struct Agent {
        std::shared_ptr<Connection> connection;
        AuditToken token;
        /// Device numbers, by which they also go.
        std::set<std::uint32_t> terminals;
        std::map<std::int64_t, Window> windows;
    };
    struct Pending {
        std::uint64_t number = 0;
        uid_t user = 0;
        SessionAlert alert;
    };

    Error objectionTo(const AuditToken& peer);
    Reported insert(Agent& agent, const Window& window);
    bool isAgent(const Connection* connection) const;
    void send(const std::shared_ptr<Connection>& agent, std::uint64_t number, const SessionAlert& alert);
    void finish(std::uint64_t number);
    void fail(std::uint64_t number, const IpcError& error);

    CodeSigning& codeSigning_;
    Sandbox& sandbox_;
    Log& log_;
    const uid_t ownUser_;

    mutable std::mutex mutex_;
    std::optional<Agent> agent_;
    std::vector<Pending> pending_;
    std::uint64_t lastAlert_ = 0;
    std::int64_t lastWindow_ = 0;
};

}  // namespace typhon
