#pragma once

#include "platform/audit_token.h"
#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/work_queues.h"

#include <cstddef>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace typhon {

class SimulatedConnection;
class SimulatedListener;

/// What the processes of a simulated machine share: who listens, and who is connected.
struct SimulatedMachine {
    SimulatedMachine(WorkQueues& workQueues, Log& systemLog, AuditToken own)
        : queues(workQueues), log(systemLog), ownToken(own),
          deadlines(workQueues.createSerialQueue("ipc deadlines"))
    {}

    WorkQueues& queues;
    Log& log;
    /// The process under test.
    const AuditToken ownToken;
    /// Answers of that process to calls that it had answered already.
    std::size_t repeatedAnswers = 0;
    /// Runs the handlers of call timers; connection queues may be held by the very item that waits.
    const std::shared_ptr<WorkQueue> deadlines;
    std::map<std::string, std::shared_ptr<SimulatedListener>> services;
    /// In the order of resuming, so that a seed replays.
    std::vector<std::shared_ptr<SimulatedListener>> resumedListeners;
    std::vector<std::shared_ptr<SimulatedConnection>> resumedConnections;
};

/// An endpoint of an anonymous listener, and who handed it over.
class SimulatedEndpoint : public ListenerEndpoint {
public:
    SimulatedEndpoint(std::weak_ptr<SimulatedListener> behind, AuditToken from)
        : listener(behind), sender(from)
    {}
    const std::weak_ptr<SimulatedListener> listener;
    const AuditToken sender;
};

class SimulatedListener : public Listener, public std::enable_shared_from_this<SimulatedListener> {
public:
    SimulatedListener(std::shared_ptr<SimulatedMachine> machine, AuditToken owner, std::string serviceName);

    void setDelegate(std::weak_ptr<ListenerDelegate> delegate) override { delegate_ = std::move(delegate); }
    void resume() override;
    void invalidate() override;
    std::shared_ptr<ListenerEndpoint> endpoint() const override;

    /// The other end of a new connection by `client`, which the delegate gets to see later; null when
    /// nobody listens.
    std::shared_ptr<SimulatedConnection> connect(const std::shared_ptr<SimulatedConnection>& client);

    const AuditToken owner;

private:
    void accept(const std::shared_ptr<SimulatedConnection>& connection);

    const std::shared_ptr<SimulatedMachine> machine_;
    /// Empty for an anonymous one.
    const std::string serviceName_;
    const std::shared_ptr<WorkQueue> queue_;
    std::weak_ptr<ListenerDelegate> delegate_;
    bool listening_ = false;
};

}  // namespace typhon
