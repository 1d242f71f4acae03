// From a message to an item of the connection's queue, or to an answer on the spot, in the thread that read
// the message.

#include "platform/argument_types.h"
#include "platform/connection_work.h"
#include "platform/linux/linux_connection.h"
#include "platform/linux/linux_incoming_call.h"
#include "platform/linux/received_call.h"

#include <utility>

namespace typhon {

ReceivedCall LinuxConnection::readCall(const BusLink& link, sd_bus_message* call)
{
    InterfaceDescriptions interfaces;
    {
        const std::lock_guard lock(mutex_);
        interfaces = exported_;
    }
    return readReceivedCall(call, std::move(interfaces), link.peer, context_->limits.message);
}

void LinuxConnection::receivedCall(BusLink& link, ReceivedCall call, BusLink::Afterwards& afterwards)
{
    if (call.member == nullptr) {
        answerOther(link, call, afterwards);
        return;
    }
    const auto& member = *call.member;
    if (!call.reading.arguments) {
        if (call.expectsReply) {
            link.failLocked(call.cookie, invalidArgumentsError(member.name, member.inTypes), afterwards);
        }
        return;
    }
    auto charge = UnansweredCalls::charge({shared_from_this(), &unanswered_}, call.reading.memory,
                                          context_->limits, {context_->heldBytes, link.peer});
    if (!charge) {
        refuseExcess(link, call, afterwards);
        return;
    }
    const LinuxIncomingCall::Origin origin{link.weak_from_this(), call.cookie, call.expectsReply};
    auto incoming = std::make_shared<LinuxIncomingCall>(
        origin, LinuxIncomingCall::Operation{std::move(call.interfaces), *call.interface, member},
        std::move(*call.reading.arguments), std::move(charge));
    enqueue([incoming](Self self) { return handleCall(self, incoming); }, afterwards);
}

Task<void> LinuxConnection::handleCall(Self self, std::shared_ptr<IncomingCall> call)
{
    // Calls that came before the peer closed are still handled; after `invalidate` nothing is.
    if (self->isInvalidatedHere()) {
        co_return;
    }
    Task<void> handling = connection_work::handleCall(self->context_->log, self->exportedObject(), call);
    co_await std::move(handling);
    static_cast<LinuxIncomingCall&>(*call).handled();
}

void LinuxConnection::answerOther(BusLink& link, const ReceivedCall& call, BusLink::Afterwards& afterwards)
{
    if (!call.expectsReply) {
        return;
    }
    const auto answer =
        standardAnswer(call.target, call.signature, call.firstText, call.secondText, call.interfaces);
    if (!answer) {
        link.failLocked(call.cookie, unknownTargetError(call.target, call.interfaces), afterwards);
    } else if (!answer->result.results) {
        link.failLocked(call.cookie, answer->result.error, afterwards);
    } else {
        link.replyLocked(call.cookie, answer->outTypes, *answer->result.results, call.target.member,
                         afterwards);
    }
}

void LinuxConnection::refuseExcess(BusLink& link, const ReceivedCall& call, BusLink::Afterwards& afterwards)
{
    context_->offenders.report(link.peer, "unanswered",
                               "process " + std::to_string(link.peer.processIdentifier) +
                                   " has too many unanswered calls; further ones are refused");
    if (call.expectsReply) {
        link.failLocked(call.cookie, {ipc_errors::limitsExceeded, "too many unanswered calls"}, afterwards);
    } else {
        // Dropping it silently would leave its sender in the belief that it was heard.
        link.punishLocked("it has too many unanswered calls", afterwards);
    }
}

}  // namespace typhon
