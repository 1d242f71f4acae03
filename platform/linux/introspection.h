#pragma once

#include "platform/ipc.h"

#include <optional>
#include <string>
#include <string_view>

namespace typhon {

/// The object that every connection exports.
inline constexpr const char* exportedObjectPath = "/com/vorlan/typhond";

/// The introspection document of a path: the interfaces at the object, the next node above it; null for a
/// path that leads nowhere.
std::optional<std::string> introspectionDocument(std::string_view path,
                                                 const InterfaceDescriptions& interfaces);

}  // namespace typhon
