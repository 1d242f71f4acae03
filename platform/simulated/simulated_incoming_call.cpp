#include "platform/simulated/simulated_incoming_call.h"

#include "platform/simulated/simulated_arguments.h"

namespace typhon {

SimulatedIncomingCall::SimulatedIncomingCall(std::shared_ptr<SimulatedMachine> machine,
                                             std::weak_ptr<SimulatedConnection> at,
                                             std::weak_ptr<SimulatedConnection> from,
                                             SimulatedConnection::Call call, std::string outTypes,
                                             bool replies)
    : machine_(std::move(machine)), at_(std::move(at)), from_(std::move(from)), call_(std::move(call)),
      outTypes_(std::move(outTypes)), replies_(replies)
{}

void SimulatedIncomingCall::reply(Arguments results)
{
    if (!replies_) {
        return;
    }
    if (!argumentsFit(outTypes_, results)) {
        TYLog_Error(machine_->log, "reply of " + call_.member + " does not fit \"" + outTypes_ + "\"");
        fail({ipc_errors::failed, "the reply could not be sent"});
        return;
    }
    answer({std::move(results), {}});
}

void SimulatedIncomingCall::fail(IpcError error)
{
    answer({std::nullopt, std::move(error)});
}

void SimulatedIncomingCall::answer(CallResult result)
{
    const auto at = at_.lock();
    const auto from = from_.lock();
    if (call_.number == 0 || !at || !from || !at->isUsable()) {
        return;
    }
    if (std::exchange(answered_, true)) {
        machine_->repeatedAnswers += at->owner == machine_->ownToken ? 1 : 0;
        return;
    }
    if (result.results) {
        result.results = argumentsFrom(at->owner, std::move(*result.results));
    }
    from->deliver(SimulatedConnection::Reply{call_.number, std::move(result)});
}

Arguments argumentsFrom(const AuditToken& sender, Arguments arguments)
{
    for (auto& argument : arguments) {
        if (auto* file = std::get_if<std::shared_ptr<TransferredFile>>(&argument)) {
            if (const auto* endpoint = dynamic_cast<const SimulatedEndpoint*>(file->get())) {
                argument = std::shared_ptr<TransferredFile>(
                    std::make_shared<SimulatedEndpoint>(endpoint->listener, sender));
            }
        }
    }
    return arguments;
}

}  // namespace typhon
