#pragma once

#include "platform/linux/bus_message.h"

#include <functional>
#include <string>

#include <systemd/sd-bus.h>

namespace typhon {

/// Called with the reply of a call, or with the error message in its place.
using BusReply = std::function<void(sd_bus_message* reply)>;

/// An empty call of a method; null when a name is malformed.
BusMessage newBusCall(sd_bus* bus, const char* service, const char* path, const char* interface,
                      const char* member);

/// Sends a call. `reply` is called later, unless the bus is lost before. A call that cannot be sent is
/// dropped, with a negative errno as the result.
int callOnBus(sd_bus* bus, BusMessage call, BusReply reply);

/// Calls a method of the bus itself that takes one string. Drops what cannot be sent.
void callBusDriver(sd_bus* bus, const char* member, const std::string& argument, BusReply reply);

/// The text of an error message, for a log: its name and what it says.
std::string textOfBusError(sd_bus_message* error);

}  // namespace typhon
