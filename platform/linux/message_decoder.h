#pragma once

#include "platform/linux/bus_message.h"
#include "platform/linux/message_reception.h"
#include "platform/linux/opened_bus.h"

#include <cstdint>
#include <span>
#include <vector>

#include <systemd/sd-bus.h>

namespace typhon {

/// Turns the bytes of one whole message into an sd-bus message, by way of an sd-bus object of its own. The
/// caller locks.
class MessageDecoder {
public:
    /// Null when it is no message. The result lives no longer than the decoder.
    sd_bus_message* decode(ReceivedMessage received);

private:
    static bool isSafe(ReceivedMessage& received);
    sd_bus_message* feed(ReceivedMessage& received);
    static int keep(sd_bus_message* message, void* decoder, sd_bus_error* error);
    bool sendSome(std::span<const std::uint8_t>& bytes, const std::vector<FileDescriptor>& descriptors);

    OpenedBus bus_;
    BusMessage message_;
};

}  // namespace typhon
