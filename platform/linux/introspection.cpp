#include "platform/linux/introspection.h"

#include "platform/argument_types.h"

namespace typhon {

namespace {

constexpr std::string_view documentType =
    "<!DOCTYPE node PUBLIC \"-//freedesktop//DTD D-BUS Object Introspection 1.0//EN\"\n"
    " \"http://www.freedesktop.org/standards/dbus/1.0/introspect.dtd\">\n";

/// Member names and signatures need no escaping.
std::string argumentsText(std::string_view types, std::string_view direction)
{
    std::string result;
    while (!types.empty()) {
        result += "   <arg type=\"" + std::string(takeCompleteType(types)) + "\" direction=\"" +
                  std::string(direction) + "\"/>\n";
    }
    return result;
}

std::string interfaceText(const InterfaceDescription& interface)
{
    std::string result = " <interface name=\"" + interface.name + "\">\n";
    for (const auto& member : interface.members) {
        result += "  <method name=\"" + member.name + "\">\n" + argumentsText(member.inTypes, "in") +
                  argumentsText(member.outTypes, "out");
        if (!member.replies) {
            result += "   <annotation name=\"org.freedesktop.DBus.Method.NoReply\" value=\"true\"/>\n";
        }
        result += "  </method>\n";
    }
    return result + " </interface>\n";
}

const std::vector<InterfaceDescription>& standardInterfaces()
{
    static const std::vector<InterfaceDescription> interfaces = {
        {"org.freedesktop.DBus.Peer", {{"Ping", "", ""}, {"GetMachineId", "", "s"}}},
        {"org.freedesktop.DBus.Introspectable", {{"Introspect", "", "s"}}},
        {"org.freedesktop.DBus.Properties",
         {{"Get", "ss", "v"}, {"Set", "ssv", ""}, {"GetAll", "s", "a{sv}"}}},
    };
    return interfaces;
}

/// The name of the node below `path` on the way to the object, or empty.
std::string_view nextNode(std::string_view path)
{
    const std::string_view object = exportedObjectPath;
    const auto length = path == "/" ? 0 : path.size();
    if (object.substr(0, length) != path.substr(0, length) || length >= object.size() ||
        object[length] != '/') {
        return {};
    }
    const auto rest = object.substr(length + 1);
    return rest.substr(0, rest.find('/'));
}

}  // namespace

std::optional<std::string> introspectionDocument(std::string_view path,
                                                 const InterfaceDescriptions& interfaces)
{
    std::string result(documentType);
    result += "<node>\n";
    if (path == exportedObjectPath) {
        for (const auto& interface : standardInterfaces()) {
            result += interfaceText(interface);
        }
        for (const auto& interface : interfaces ? *interfaces : std::vector<InterfaceDescription>()) {
            result += interfaceText(interface);
        }
        return result + "</node>\n";
    }
    const auto child = nextNode(path);
    if (child.empty()) {
        return std::nullopt;
    }
    return result + " <node name=\"" + std::string(child) + "\"/>\n</node>\n";
}

}  // namespace typhon
