#pragma once

#include "platform/ipc.h"
#include "platform/linux/bus_message_codec.h"
#include "platform/linux/standard_interfaces.h"

#include <cstdint>
#include <string>

#include <systemd/sd-bus.h>

namespace typhon {

/// All that a call says, read from its message.
struct ReceivedCall {
    std::uint64_t cookie = 0;
    bool expectsReply = false;
    /// Where `interface` and `member` stand.
    InterfaceDescriptions interfaces;
    /// Null when no described member takes the call.
    const MemberDescription* member = nullptr;
    /// Of the member.
    const InterfaceDescription* interface = nullptr;
    /// Of the member.
    MessageReading reading;
    // Of a call that no member takes: its target, its signature, and its first arguments as far as they are
    // strings.
    CallTarget target;
    std::string signature;
    std::string firstText;
    std::string secondText;
};

/// Reads a call from `sender` to an object with these interfaces. The caller locks the bus of the message.
ReceivedCall readReceivedCall(sd_bus_message* call, InterfaceDescriptions interfaces,
                              const AuditToken& sender, const MessageLimits& limits);

}  // namespace typhon
