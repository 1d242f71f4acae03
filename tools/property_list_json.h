#pragma once

#include "platform/property_list.h"

#include <optional>
#include <string>
#include <string_view>

#include <nlohmann/json.hpp>

namespace typhon {

/// A property list as JSON: data as base64 text, a date as text in UTC ("2026-01-31T12:00:00Z"), a real that
/// JSON cannot hold as the text "nan", "inf" or "-inf". Everything else is itself.
nlohmann::json jsonOf(const PropertyList& value);

/// JSON on indented lines, without a final newline. Text that is no UTF-8 has U+FFFD in its place.
std::string jsonText(const nlohmann::json& json);

/// The property list that JSON text stands for, or null when it is no JSON, holds a null or an integer
/// beyond 64 signed bits, repeats a key or is nested deeper than 128. Text stays text: data and dates have
/// no JSON form of their own.
std::optional<PropertyList> propertyListFromJson(std::string_view text);

}  // namespace typhon
