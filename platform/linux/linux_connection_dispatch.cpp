// From a message to an item of the connection's queue, or to an answer on the spot. All of it runs under the
// link's lock, in the thread that read the message.

#include "platform/argument_types.h"
#include "platform/connection_work.h"
#include "platform/linux/introspection.h"
#include "platform/linux/linux_connection.h"
#include "platform/linux/linux_incoming_call.h"

namespace typhon {

namespace {

std::string orEmpty(const char* text)
{
    return text == nullptr ? std::string() : std::string(text);
}

CallTarget targetOf(sd_bus_message* call)
{
    return {orEmpty(sd_bus_message_get_path(call)), orEmpty(sd_bus_message_get_interface(call)),
            orEmpty(sd_bus_message_get_member(call))};
}

/// A caller may leave the interface out: then it is the first that has such a member.
void completeInterface(CallTarget& target, const InterfaceDescriptions& interfaces)
{
    if (!target.interface.empty() || !interfaces) {
        return;
    }
    for (const auto& interface : *interfaces) {
        if (findMember(interfaces, interface.name, target.member) != nullptr) {
            target.interface = interface.name;
            return;
        }
    }
}

std::uint64_t cookieOf(sd_bus_message* call)
{
    std::uint64_t cookie = 0;
    sd_bus_message_get_cookie(call, &cookie);
    return cookie;
}

bool expectsReply(sd_bus_message* call)
{
    return sd_bus_message_get_expect_reply(call) > 0;
}

/// The next argument, if it is a string.
std::string nextText(sd_bus_message* call)
{
    char type = 0;
    const char* text = nullptr;
    const bool isText = sd_bus_message_peek_type(call, &type, nullptr) > 0 && type == 's' &&
                        sd_bus_message_read_basic(call, 's', &text) > 0;
    return isText ? orEmpty(text) : std::string();
}

}  // namespace

void LinuxConnection::receivedCall(BusLink& link, sd_bus_message* call, BusLink::Afterwards& afterwards)
{
    InterfaceDescriptions interfaces;
    {
        const std::lock_guard lock(mutex_);
        interfaces = exported_;
    }
    auto target = targetOf(call);
    completeInterface(target, interfaces);
    const auto* member =
        target.path == exportedObjectPath ? findMember(interfaces, target.interface, target.member) : nullptr;
    if (member == nullptr) {
        answerOther(link, call, target, interfaces, afterwards);
        return;
    }
    auto reading = readMessage(call, member->inTypes, link.peer, context_->limits.message);
    if (!reading.arguments) {
        if (expectsReply(call)) {
            link.failLocked(cookieOf(call), invalidArgumentsError(member->name, member->inTypes), afterwards);
        }
        return;
    }
    auto charge = unanswered_->charge(reading.memory,
                                      std::make_unique<HeldBytes::Claim>(context_->heldBytes, link.peer));
    if (!charge) {
        refuseExcess(link, call, afterwards);
        return;
    }
    const LinuxIncomingCall::Origin origin{link.weak_from_this(), cookieOf(call), expectsReply(call)};
    auto incoming = std::make_shared<LinuxIncomingCall>(origin, target.interface, *member,
                                                        std::move(*reading.arguments), std::move(charge));
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

void LinuxConnection::answerOther(BusLink& link, sd_bus_message* call, const CallTarget& target,
                                  const InterfaceDescriptions& interfaces, BusLink::Afterwards& afterwards)
{
    if (!expectsReply(call)) {
        return;
    }
    const auto first = nextText(call);
    const auto second = nextText(call);
    const auto answer =
        standardAnswer(target, orEmpty(sd_bus_message_get_signature(call, true)), first, second, interfaces);
    if (!answer) {
        link.failLocked(cookieOf(call), unknownTargetError(target, interfaces), afterwards);
    } else if (!answer->result.results) {
        link.failLocked(cookieOf(call), answer->result.error, afterwards);
    } else {
        link.replyLocked(cookieOf(call), answer->outTypes, *answer->result.results, target.member,
                         afterwards);
    }
}

void LinuxConnection::refuseExcess(BusLink& link, sd_bus_message* call, BusLink::Afterwards& afterwards)
{
    context_->offenders.report(link.peer, "unanswered",
                               "process " + std::to_string(link.peer.processIdentifier) +
                                   " has too many unanswered calls; further ones are refused");
    if (expectsReply(call)) {
        link.failLocked(cookieOf(call), {ipc_errors::limitsExceeded, "too many unanswered calls"},
                        afterwards);
    } else {
        // Dropping it silently would leave its sender in the belief that it was heard.
        link.punishLocked("it has too many unanswered calls", afterwards);
    }
}

}  // namespace typhon
