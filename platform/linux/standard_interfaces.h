#pragma once

#include "platform/ipc.h"

#include <optional>
#include <string>
#include <string_view>

namespace typhon {

/// Where a call is addressed to.
struct CallTarget {
    std::string path;
    /// Empty when the caller left it to us.
    std::string interface;
    std::string member;
};

/// The answer of one of the interfaces that every D-Bus object has.
struct StandardAnswer {
    std::string outTypes;
    CallResult result;
};

/// Answers `org.freedesktop.DBus.Introspectable` and `Properties` (there are no properties), and the greeting
/// that tools send to what they take for a bus; null for everything else. `firstText` and `secondText` are
/// the arguments of the call that are strings, if any.
/// (`Peer` is answered by sd-bus.)
std::optional<StandardAnswer> standardAnswer(const CallTarget& target, const std::string& signature,
                                             const std::string& firstText, const std::string& secondText,
                                             const InterfaceDescriptions& interfaces);

/// Why a call that no described member takes fails: no such object, interface or member.
IpcError unknownTargetError(const CallTarget& target, const InterfaceDescriptions& interfaces);

}  // namespace typhon
