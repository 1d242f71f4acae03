#pragma once

#include "platform/application_registry.h"

#include <map>
#include <optional>
#include <string>
#include <utility>

namespace typhon {

/// The applications a test says are installed. One thread.
class SimulatedApplicationRegistry final : public ApplicationRegistry {
public:
    std::optional<SWApplicationRecord> record(const std::string& bundleIdentifier,
                                              bool allowPlaceholder) override
    {
        const auto found = records_.find(bundleIdentifier);
        if (found == records_.end() || (found->second.isPlaceholder && !allowPlaceholder)) {
            return std::nullopt;
        }
        return found->second;
    }

    /// Adds the application, or replaces its record.
    void install(SWApplicationRecord record)
    {
        auto identifier = record.bundleIdentifier;
        records_.insert_or_assign(std::move(identifier), std::move(record));
    }
    void remove(const std::string& bundleIdentifier) { records_.erase(bundleIdentifier); }

private:
    std::map<std::string, SWApplicationRecord> records_;
};

}  // namespace typhon
