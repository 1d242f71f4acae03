#pragma once

#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/work_queues.h"

#include <cstddef>
#include <memory>
#include <string>

namespace typhon {

struct SimulatedMachine;

/// The IPC transport of a simulated machine: several processes, each with its audit token, their named and
/// anonymous listeners and the connections between them. Used directly it is the transport of the process
/// under test (the daemon); `process` gives the transport as another process sees it. Messages are checked
/// against the interface descriptions as on the wire and travel as items of the receiving connection's serial
/// queue, so that the scheduler decides about every order that a real machine could show. One thread only.
class SimulatedIpc : public Ipc {
public:
    /// `queues` and `log` outlive everything made here. `ownToken` is what peers see of the process under
    /// test.
    SimulatedIpc(WorkQueues& queues, Log& log, AuditToken ownToken = AuditToken{1, 1, 1, 1, 0, 1});
    /// Invalidates every connection and listener.
    ~SimulatedIpc() override;

    std::shared_ptr<Listener> listenerForService(std::string name) override;
    std::shared_ptr<Listener> anonymousListener() override;
    std::shared_ptr<Connection> connectionToEndpoint(std::shared_ptr<ListenerEndpoint> endpoint) override;
    std::shared_ptr<Connection> connectionToService(std::string name) override;

    /// The transport as the process with that token sees it. Valid for as long as this lives.
    std::shared_ptr<Ipc> process(const AuditToken& token);

    /// A connection of the process with that token to a service, for a test to configure and resume.
    std::shared_ptr<Connection> connectClient(std::string service, const AuditToken& token);

    /// Ends a process: its listeners and its ends of connections go, without any of its handlers being
    /// called.
    void endProcess(const AuditToken& token);
    /// The same for all processes at once.
    void endAllProcesses();

    /// Ends of connections that are resumed and not yet invalidated, of all processes.
    std::size_t connectionCount() const;

    /// How often the process under test answered a call that it had answered already, as long as its
    /// connection was there. The caller never sees it.
    std::size_t repeatedAnswers() const;

private:
    const std::shared_ptr<SimulatedMachine> machine_;
    const std::shared_ptr<Ipc> own_;
};

}  // namespace typhon
