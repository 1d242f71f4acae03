#include "sdk/peer_call.h"

#include "platform/linux/bus_message.h"

#include <memory>

#include <systemd/sd-bus.h>

namespace typhon {

std::optional<Arguments> PeerCall::argumentsOf(const wire::Operation& operation) const
{
    if (sd_bus_message_is_method_call(message_, operation.interface, operation.member) <= 0) {
        return std::nullopt;
    }
    return readArguments(message_, operation.inTypes);
}

void PeerCall::reply() const
{
    sd_bus_reply_method_return(message_, "");
}

void PeerCall::reply(const wire::Operation& operation, const Arguments& results) const
{
    sd_bus_message* made = nullptr;
    if (sd_bus_message_new_method_return(message_, &made) < 0) {
        return;
    }
    if (appendArguments(made, operation.outTypes, results, true) >= 0) {
        sd_bus_send(nullptr, made, nullptr);
    }
    sd_bus_message_unref(made);
}

std::function<void()> PeerCall::laterReply() const
{
    const std::shared_ptr<sd_bus_message> kept(sd_bus_message_ref(message_), sd_bus_message_unref);
    return [kept] { sd_bus_reply_method_return(kept.get(), ""); };
}

void PeerCall::refuse() const
{
    sd_bus_reply_method_errorf(message_, ipc_errors::unknownMethod, "this program does not serve that");
}

}  // namespace typhon
