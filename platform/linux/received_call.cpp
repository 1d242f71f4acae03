#include "platform/linux/received_call.h"

#include "platform/argument_types.h"
#include "platform/linux/introspection.h"

#include <algorithm>
#include <string_view>
#include <utility>

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

std::string_view viewOf(const char* text)
{
    return text == nullptr ? std::string_view() : std::string_view(text);
}

/// The interface that is called; null when there is none. A caller may leave it out: then it is the first
/// that has such a member.
const InterfaceDescription* interfaceOf(sd_bus_message* call, const InterfaceDescriptions& interfaces)
{
    const auto name = viewOf(sd_bus_message_get_interface(call));
    const auto member = viewOf(sd_bus_message_get_member(call));
    const auto isCalled = [&](const InterfaceDescription& interface) {
        return name.empty() ? findMember(interface, member) != nullptr : interface.name == name;
    };
    if (!interfaces) {
        return nullptr;
    }
    const auto found = std::ranges::find_if(*interfaces, isCalled);
    return found == interfaces->end() ? nullptr : &*found;
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

ReceivedCall readReceivedCall(sd_bus_message* call, InterfaceDescriptions interfaces,
                              const AuditToken& sender, const MessageLimits& limits)
{
    ReceivedCall result;
    sd_bus_message_get_cookie(call, &result.cookie);
    result.expectsReply = sd_bus_message_get_expect_reply(call) > 0;
    result.interface = interfaceOf(call, interfaces);
    if (result.interface != nullptr && viewOf(sd_bus_message_get_path(call)) == exportedObjectPath) {
        result.member = findMember(*result.interface, viewOf(sd_bus_message_get_member(call)));
    }
    if (result.member != nullptr) {
        result.reading = readMessage(call, result.member->inTypes, sender, limits);
    } else {
        result.target = targetOf(call);
        if (result.interface != nullptr) {
            result.target.interface = result.interface->name;
        }
        result.signature = orEmpty(sd_bus_message_get_signature(call, 1));
        result.firstText = nextText(call);
        result.secondText = nextText(call);
    }
    result.interfaces = std::move(interfaces);
    return result;
}

}  // namespace typhon
