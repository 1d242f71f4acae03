#pragma once

#include "platform/property_list.h"

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// Reply blocks. Each is called at most once, from any thread; one that is dropped uncalled means that the
/// caller never hears.
using EmptyReply = std::function<void()>;
using BooleanReply = std::function<void(bool)>;
using StringReply = std::function<void(std::string)>;
/// A dictionary.
using DictionaryReply = std::function<void(PropertyList)>;
/// A dictionary or null.
using OptionalDictionaryReply = std::function<void(std::optional<PropertyList>)>;
/// Success, and a dictionary or null.
using OutcomeReply = std::function<void(bool, std::optional<PropertyList>)>;

/// An array of strings, or null.
using OptionalStrings = std::optional<std::vector<std::string>>;

}  // namespace typhon
