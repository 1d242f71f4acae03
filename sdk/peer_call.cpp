#include "sdk/peer_call.h"

#include "platform/linux/bus_message.h"

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

void PeerCall::refuse() const
{
    sd_bus_reply_method_errorf(message_, ipc_errors::unknownMethod, "this program does not serve that");
}

}  // namespace typhon
