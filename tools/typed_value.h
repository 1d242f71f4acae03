#pragma once

#include "platform/property_list.h"

#include <optional>
#include <string>

namespace typhon {

/// The names of the types that `typedValue` knows.
inline constexpr const char* valueTypes[] = {"boolean", "integer", "real", "string", "data", "date", "json"};

/// A value as typed on a command line. `type` is one of `valueTypes`: "data" is base64, "date" is
/// 2026-01-31T12:00:00Z; an empty type takes JSON for what it is, and anything else that does not begin like
/// JSON ({, [ or ") for a string. Null when the text does not fit the type.
std::optional<PropertyList> typedValue(const std::string& text, const std::string& type);

}  // namespace typhon
