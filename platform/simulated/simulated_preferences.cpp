#include "platform/simulated/simulated_preferences.h"

#include <utility>

namespace typhon {

std::optional<PropertyList> SimulatedPreferences::value(const std::string& key)
{
    const auto changed = unsynchronized_.find(key);
    return changed == unsynchronized_.end() ? durableValue(key) : changed->second;
}

void SimulatedPreferences::setValue(const std::string& key, std::optional<PropertyList> value)
{
    ++writes_;
    unsynchronized_.insert_or_assign(key, std::move(value));
}

bool SimulatedPreferences::synchronize()
{
    ++synchronizes_;
    if (failing_) {
        return false;
    }
    for (auto& [key, value] : std::exchange(unsynchronized_, {})) {
        changeFromOutside(key, std::move(value));
    }
    return true;
}

void SimulatedPreferences::changeFromOutside(const std::string& key, std::optional<PropertyList> value)
{
    if (value) {
        durable_.insert_or_assign(key, std::move(*value));
    } else {
        durable_.erase(key);
    }
}

std::optional<PropertyList> SimulatedPreferences::durableValue(const std::string& key) const
{
    const auto found = durable_.find(key);
    return found == durable_.end() ? std::nullopt : std::optional(found->second);
}

}  // namespace typhon
