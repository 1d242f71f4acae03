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
    bool isKnownToBeAbsent(const std::string& bundleIdentifier) override
    {
        return isComplete_ && !record(bundleIdentifier, false);
    }

    /// Adds the application, or replaces its record.
    void install(SWApplicationRecord record)
    {
        auto identifier = record.bundleIdentifier;
        records_.insert_or_assign(std::move(identifier), std::move(record));
    }
    void remove(const std::string& bundleIdentifier) { records_.erase(bundleIdentifier); }
    /// Whether all there is can be looked at, as at first. When not, nothing is known to be absent.
    void setComplete(bool isComplete) { isComplete_ = isComplete; }

private:
    std::map<std::string, SWApplicationRecord> records_;
    bool isComplete_ = true;
};

}  // namespace typhon
