#include "platform/linux/linux_incoming_call.h"

#include <utility>

namespace typhon {

LinuxIncomingCall::LinuxIncomingCall(Origin origin, Operation operation, Arguments arguments,
                                     std::unique_ptr<UnansweredCalls::Charge> charge)
    : origin_(std::move(origin)), operation_(std::move(operation)), arguments_(std::move(arguments)),
      charge_(std::move(charge))
{}

void LinuxIncomingCall::reply(Arguments results)
{
    if (!operation_.member.replies) {
        return;
    }
    if (const auto link = takeAnswer()) {
        link->reply(origin_.cookie, operation_.member.outTypes, results, operation_.member.name);
    }
}

void LinuxIncomingCall::fail(IpcError error)
{
    if (const auto link = takeAnswer()) {
        link->fail(origin_.cookie, error);
    }
}

void LinuxIncomingCall::handled()
{
    std::unique_ptr<UnansweredCalls::Charge> over;
    const std::lock_guard lock(mutex_);
    if (!operation_.member.replies || !origin_.replyExpected) {
        over = std::move(charge_);
    }
}

std::shared_ptr<BusLink> LinuxIncomingCall::takeAnswer()
{
    std::unique_ptr<UnansweredCalls::Charge> over;
    const std::lock_guard lock(mutex_);
    over = std::move(charge_);
    const bool first = !std::exchange(answered_, true);
    return first && origin_.replyExpected ? origin_.link.lock() : nullptr;
}

}  // namespace typhon
