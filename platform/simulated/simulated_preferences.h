#pragma once

#include "platform/preferences.h"

#include <cstddef>
#include <map>
#include <optional>
#include <string>

namespace typhon {

/// Preferences in memory, which keep apart what is durable and what a crash would lose. One thread.
class SimulatedPreferences final : public Preferences {
public:
    std::optional<PropertyList> value(const std::string& key) override;
    void setValue(const std::string& key, std::optional<PropertyList> value) override;
    bool synchronize() override;

    /// Forgets what was not synchronised, as the end of the process does.
    void restart() { unsynchronized_.clear(); }
    /// While true, `synchronize` fails and keeps the changes.
    void setFailing(bool failing) { failing_ = failing; }
    /// A change by somebody else, straight into the store; null removes the key.
    void changeFromOutside(const std::string& key, std::optional<PropertyList> value);

    /// What a restarted daemon would read.
    const PropertyList::Dictionary& durable() const { return durable_; }
    std::optional<PropertyList> durableValue(const std::string& key) const;
    bool hasUnsynchronizedChanges() const { return !unsynchronized_.empty(); }
    /// How often `setValue` and `synchronize` were called, failed calls included.
    std::size_t writes() const { return writes_; }
    std::size_t synchronizes() const { return synchronizes_; }

private:
    PropertyList::Dictionary durable_;
    std::map<std::string, std::optional<PropertyList>> unsynchronized_;
    bool failing_ = false;
    std::size_t writes_ = 0;
    std::size_t synchronizes_ = 0;
};

}  // namespace typhon
