#include "platform/simulated/simulated_ipc.h"

#include "platform/simulated/simulated_connection.h"
#include "platform/simulated/simulated_machine.h"

namespace typhon {

namespace {

/// The transport as one process sees it.
class SimulatedProcess : public Ipc {
public:
    SimulatedProcess(std::shared_ptr<SimulatedMachine> machine, AuditToken token)
        : machine_(std::move(machine)), token_(token)
    {}

    std::shared_ptr<Listener> listenerForService(std::string name) override
    {
        return std::make_shared<SimulatedListener>(machine_, token_, std::move(name));
    }
    std::shared_ptr<Listener> anonymousListener() override
    {
        return std::make_shared<SimulatedListener>(machine_, token_, "");
    }
    std::shared_ptr<Connection> connectionToEndpoint(std::shared_ptr<ListenerEndpoint> endpoint) override;
    std::shared_ptr<Connection> connectionToService(std::string name) override;

private:
    const std::shared_ptr<SimulatedMachine> machine_;
    const AuditToken token_;
};

std::shared_ptr<Connection> SimulatedProcess::connectionToEndpoint(std::shared_ptr<ListenerEndpoint> endpoint)
{
    auto connector = [endpoint](const auto& client) -> std::shared_ptr<SimulatedConnection> {
        const auto* target = dynamic_cast<const SimulatedEndpoint*>(endpoint.get());
        const auto listener = target == nullptr ? nullptr : target->listener.lock();
        // Otherwise a process could make us speak to a service of somebody else.
        if (!listener || listener->owner.effectiveUser != target->sender.effectiveUser) {
            return nullptr;
        }
        return listener->connect(client);
    };
    return std::make_shared<SimulatedConnection>(machine_, token_, SimulatedConnection::Origin::endpoint,
                                                 connector);
}

std::shared_ptr<Connection> SimulatedProcess::connectionToService(std::string name)
{
    auto connector = [machine = machine_.get(),
                      name](const auto& client) -> std::shared_ptr<SimulatedConnection> {
        const auto found = machine->services.find(name);
        return found == machine->services.end() ? nullptr : found->second->connect(client);
    };
    return std::make_shared<SimulatedConnection>(machine_, token_, SimulatedConnection::Origin::service,
                                                 connector);
}

}  // namespace

SimulatedIpc::SimulatedIpc(WorkQueues& queues, Log& log, AuditToken ownToken)
    : machine_(std::make_shared<SimulatedMachine>(queues, log, ownToken)),
      own_(std::make_shared<SimulatedProcess>(machine_, ownToken))
{}

SimulatedIpc::~SimulatedIpc()
{
    for (const auto& listener : std::vector(machine_->resumedListeners)) {
        listener->invalidate();
    }
    for (const auto& connection : std::vector(machine_->resumedConnections)) {
        connection->invalidate();
    }
}

std::shared_ptr<Listener> SimulatedIpc::listenerForService(std::string name)
{
    return own_->listenerForService(std::move(name));
}

std::shared_ptr<Listener> SimulatedIpc::anonymousListener()
{
    return own_->anonymousListener();
}

std::shared_ptr<Connection> SimulatedIpc::connectionToEndpoint(std::shared_ptr<ListenerEndpoint> endpoint)
{
    return own_->connectionToEndpoint(std::move(endpoint));
}

std::shared_ptr<Connection> SimulatedIpc::connectionToService(std::string name)
{
    return own_->connectionToService(std::move(name));
}

std::shared_ptr<Ipc> SimulatedIpc::process(const AuditToken& token)
{
    return std::make_shared<SimulatedProcess>(machine_, token);
}

std::shared_ptr<Connection> SimulatedIpc::connectClient(std::string service, const AuditToken& token)
{
    return process(token)->connectionToService(std::move(service));
}

void SimulatedIpc::endProcess(const AuditToken& token)
{
    for (const auto& listener : std::vector(machine_->resumedListeners)) {
        if (listener->owner == token) {
            listener->invalidate();
        }
    }
    for (const auto& connection : std::vector(machine_->resumedConnections)) {
        if (connection->owner == token) {
            connection->die();
        }
    }
}

void SimulatedIpc::endAllProcesses()
{
    for (const auto& listener : std::vector(machine_->resumedListeners)) {
        listener->invalidate();
    }
    for (const auto& connection : std::vector(machine_->resumedConnections)) {
        connection->die();
    }
}

std::size_t SimulatedIpc::connectionCount() const
{
    return machine_->resumedConnections.size();
}

std::size_t SimulatedIpc::repeatedAnswers() const
{
    return machine_->repeatedAnswers;
}

}  // namespace typhon
