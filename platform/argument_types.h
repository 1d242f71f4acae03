#pragma once

#include "platform/ipc.h"

#include <algorithm>
#include <cstddef>
#include <string>
#include <string_view>

namespace typhon {

/// Takes the first complete type off the front of a valid D-Bus signature ("aa{sv}s" gives "aa{sv}").
inline std::string_view takeCompleteType(std::string_view& types)
{
    std::size_t end = 0;
    while (end < types.size() && types[end] == 'a') {
        ++end;
    }
    int open = 0;
    do {
        if (end == types.size()) {
            break;
        }
        const char code = types[end++];
        open += (code == '(' || code == '{') ? 1 : (code == ')' || code == '}') ? -1 : 0;
    } while (open > 0);
    const auto first = types.substr(0, end);
    types.remove_prefix(end);
    return first;
}

/// The described member, or null. The pointer lives as long as the description.
inline const MemberDescription* findMember(const InterfaceDescription& interface, std::string_view member)
{
    const auto found = std::ranges::find(interface.members, member, &MemberDescription::name);
    return found == interface.members.end() ? nullptr : &*found;
}

/// The same in any of several interfaces, by name.
inline const MemberDescription* findMember(const InterfaceDescriptions& interfaces,
                                           std::string_view interface, std::string_view member)
{
    if (!interfaces) {
        return nullptr;
    }
    for (const auto& description : *interfaces) {
        const auto* found = description.name == interface ? findMember(description, member) : nullptr;
        if (found != nullptr) {
            return found;
        }
    }
    return nullptr;
}

/// The error for a call of a member that nobody described.
inline IpcError unknownMethodError(std::string_view interface, std::string_view member)
{
    return {ipc_errors::unknownMethod,
            "there is no member " + std::string(member) + " in interface " + std::string(interface)};
}

/// The error for arguments that do not fit `types`.
inline IpcError invalidArgumentsError(std::string_view member, std::string_view types)
{
    return {ipc_errors::invalidArguments,
            std::string(member) + " takes \"" + std::string(types) + "\" in the ranges of their types"};
}

}  // namespace typhon
