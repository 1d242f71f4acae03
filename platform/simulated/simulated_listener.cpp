#include "platform/simulated/simulated_connection.h"
#include "platform/simulated/simulated_machine.h"

namespace typhon {

SimulatedListener::SimulatedListener(std::shared_ptr<SimulatedMachine> machine, AuditToken ownerToken,
                                     std::string serviceName)
    : owner(ownerToken), machine_(std::move(machine)), serviceName_(std::move(serviceName)),
      queue_(machine_->queues.createSerialQueue("listener " + serviceName_))
{}

void SimulatedListener::resume()
{
    if (!serviceName_.empty() && !machine_->services.emplace(serviceName_, shared_from_this()).second) {
        TYLog_Error(machine_->log, "cannot listen on " + serviceName_ + ": somebody else does");
        return;
    }
    listening_ = true;
    machine_->resumedListeners.push_back(shared_from_this());
}

void SimulatedListener::invalidate()
{
    if (std::exchange(listening_, false)) {
        const auto self = shared_from_this();
        machine_->services.erase(serviceName_);
        std::erase(machine_->resumedListeners, self);
    }
}

std::shared_ptr<ListenerEndpoint> SimulatedListener::endpoint() const
{
    if (!serviceName_.empty()) {
        return nullptr;
    }
    auto self = std::const_pointer_cast<SimulatedListener>(shared_from_this());
    return std::make_shared<SimulatedEndpoint>(self, owner);
}

std::shared_ptr<SimulatedConnection>
SimulatedListener::connect(const std::shared_ptr<SimulatedConnection>& client)
{
    if (!listening_) {
        return nullptr;
    }
    auto accepted = std::make_shared<SimulatedConnection>(machine_, owner,
                                                          SimulatedConnection::Origin::accepted, nullptr);
    accepted->setPeer(client);
    queue_->async([self = shared_from_this(), accepted] { self->accept(accepted); });
    return accepted;
}

void SimulatedListener::accept(const std::shared_ptr<SimulatedConnection>& connection)
{
    const auto delegate = delegate_.lock();
    if (!listening_ || !delegate || !delegate->listener(*this, connection)) {
        connection->invalidate();
    }
}

}  // namespace typhon
