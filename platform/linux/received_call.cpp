#include "platform/linux/received_call.h"

#include "platform/argument_types.h"
#include "platform/linux/introspection.h"

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
    result.target = targetOf(call);
    sd_bus_message_get_cookie(call, &result.cookie);
    result.expectsReply = sd_bus_message_get_expect_reply(call) > 0;
    completeInterface(result.target, interfaces);
    if (result.target.path == exportedObjectPath) {
        result.member = findMember(interfaces, result.target.interface, result.target.member);
    }
    if (result.member != nullptr) {
        result.reading = readMessage(call, result.member->inTypes, sender, limits);
    } else {
        result.signature = orEmpty(sd_bus_message_get_signature(call, 1));
        result.firstText = nextText(call);
        result.secondText = nextText(call);
    }
    result.interfaces = std::move(interfaces);
    return result;
}

}  // namespace typhon
