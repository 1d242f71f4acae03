#include "platform/linux/bus_calls.h"

#include <utility>

namespace typhon {

namespace {

int replied(sd_bus_message* reply, void* function, sd_bus_error*)
{
    (*static_cast<BusReply*>(function))(reply);
    return 1;
}

void dropFunction(void* function)
{
    delete static_cast<BusReply*>(function);
}

}  // namespace

BusMessage newBusCall(sd_bus* bus, const char* service, const char* path, const char* interface,
                      const char* member)
{
    sd_bus_message* raw = nullptr;
    sd_bus_message_new_method_call(bus, &raw, service, path, interface, member);
    return BusMessage(raw);
}

int callOnBus(sd_bus* bus, BusMessage call, BusReply reply)
{
    auto function = std::make_unique<BusReply>(std::move(reply));
    sd_bus_slot* slot = nullptr;
    const int result = sd_bus_call_async(bus, &slot, call.get(), replied, function.get(), 0);
    if (result < 0) {
        return result;
    }
    // The bus keeps the slot until the reply is there, or to its own end; the function goes with it.
    sd_bus_slot_set_destroy_callback(slot, dropFunction);
    sd_bus_slot_set_floating(slot, 1);
    sd_bus_slot_unref(slot);
    static_cast<void>(function.release());
    return 0;
}

void callBusDriver(sd_bus* bus, const char* member, const std::string& argument, BusReply reply)
{
    auto call =
        newBusCall(bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus", member);
    if (call && sd_bus_message_append(call.get(), "s", argument.c_str()) >= 0) {
        callOnBus(bus, std::move(call), std::move(reply));
    }
}

std::string textOfBusError(sd_bus_message* error)
{
    const auto* details = sd_bus_message_get_error(error);
    if (details == nullptr || details->name == nullptr) {
        return "unknown error";
    }
    return std::string(details->name) + ": " + (details->message == nullptr ? "" : details->message);
}

}  // namespace typhon
