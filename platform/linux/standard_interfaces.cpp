#include "platform/linux/standard_interfaces.h"

#include "platform/argument_types.h"
#include "platform/linux/introspection.h"

#include <algorithm>

namespace typhon {

namespace {

constexpr const char* unknownObject = "org.freedesktop.DBus.Error.UnknownObject";
constexpr const char* unknownInterface = "org.freedesktop.DBus.Error.UnknownInterface";
constexpr const char* unknownProperty = "org.freedesktop.DBus.Error.UnknownProperty";
constexpr std::string_view busInterface = "org.freedesktop.DBus";
constexpr std::string_view busPath = "/org/freedesktop/DBus";
constexpr std::string_view peerInterface = "org.freedesktop.DBus.Peer";
constexpr std::string_view introspectable = "org.freedesktop.DBus.Introspectable";
constexpr std::string_view properties = "org.freedesktop.DBus.Properties";

StandardAnswer failure(IpcError error)
{
    return {"", {std::nullopt, std::move(error)}};
}

bool isDescribed(const std::string& interface, const InterfaceDescriptions& interfaces)
{
    return interface == properties || interface == introspectable ||
           (interfaces && std::any_of(interfaces->begin(), interfaces->end(), [&](const auto& description) {
                return description.name == interface;
            }));
}

IpcError unknownInterfaceError(const std::string& interface)
{
    return {unknownInterface, "there is no interface " + interface};
}

StandardAnswer introspect(const CallTarget& target, const std::string& signature,
                          const InterfaceDescriptions& interfaces)
{
    if (target.member != "Introspect") {
        return failure(unknownMethodError(introspectable, target.member));
    }
    if (!signature.empty()) {
        return failure(invalidArgumentsError(target.member, ""));
    }
    auto document = introspectionDocument(target.path, interfaces);
    if (!document) {
        return failure({unknownObject, "there is no object " + target.path});
    }
    return {"s", {Arguments{PropertyList(std::move(*document))}, {}}};
}

StandardAnswer answerProperties(const CallTarget& target, const std::string& signature,
                                const std::string& interface, const std::string& property,
                                const InterfaceDescriptions& interfaces)
{
    const bool all = target.member == "GetAll";
    const std::string types = all ? "s" : target.member == "Get" ? "ss" : target.member == "Set" ? "ssv" : "";
    if (types.empty()) {
        return failure(unknownMethodError(properties, target.member));
    }
    if (signature != types) {
        return failure(invalidArgumentsError(target.member, types));
    }
    if (target.path != exportedObjectPath) {
        return failure({unknownObject, "there is no object " + target.path});
    }
    // An empty interface name means all of them.
    if (!interface.empty() && !isDescribed(interface, interfaces)) {
        return failure(unknownInterfaceError(interface));
    }
    if (!all) {
        return failure({unknownProperty, "there is no property " + property});
    }
    return {"a{sv}", {Arguments{PropertyList(PropertyList::Dictionary{})}, {}}};
}

}  // namespace

std::optional<StandardAnswer> standardAnswer(const CallTarget& target, const std::string& signature,
                                             const std::string& firstText, const std::string& secondText,
                                             const InterfaceDescriptions& interfaces)
{
    // There is no bus, but tools that are given an address (gdbus among them) take it for one and greet it.
    if (target.interface == busInterface && target.path == busPath && target.member == "Hello") {
        return StandardAnswer{"s", {Arguments{PropertyList(":1.1")}, {}}};
    }
    // sd-bus answers this itself, where it read the message.
    if (target.interface == peerInterface && target.member == "Ping" && signature.empty()) {
        return StandardAnswer{"", {Arguments{}, {}}};
    }
    if (target.interface == introspectable) {
        return introspect(target, signature, interfaces);
    }
    if (target.interface == properties) {
        return answerProperties(target, signature, firstText, secondText, interfaces);
    }
    return std::nullopt;
}

IpcError unknownTargetError(const CallTarget& target, const InterfaceDescriptions& interfaces)
{
    if (target.path != exportedObjectPath) {
        return {unknownObject, "there is no object " + target.path};
    }
    if (!target.interface.empty() && !isDescribed(target.interface, interfaces)) {
        return unknownInterfaceError(target.interface);
    }
    return unknownMethodError(target.interface, target.member);
}

}  // namespace typhon
