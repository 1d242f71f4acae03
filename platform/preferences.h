#pragma once

#include "platform/property_list.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <utility>

namespace typhon {

/// The preferences of the daemon's own domain, `com.vorlan.typhond`. Any thread. Reads see changes that
/// others made to the store. Changes made here are merged into the store key by key when synchronised, so
/// that a change somebody else made to another key is never lost.
class Preferences {
public:
    virtual ~Preferences() = default;
    /// The value of `key`, with unsynchronised changes, or null. An unreadable store reads as empty.
    virtual std::optional<PropertyList> value(const std::string& key) = 0;
    /// Changes `key` (null removes it) in memory; `synchronize` makes it durable.
    virtual void setValue(const std::string& key, std::optional<PropertyList> value) = 0;
    /// Changes the entries of a dictionary preference in memory, for long dictionaries without copying them.
    /// One that is missing or of another kind is changed from an empty one. `change` runs once, before this
    /// returns, and uses no preferences.
    virtual void changeDictionary(const std::string& key,
                                  const std::function<void(PropertyList::Dictionary& entries)>& change)
    {
        auto entries = dictionary(key);
        change(entries);
        setValue(key, std::move(entries));
    }
    /// Writes the changes to disk and flushes them, at the level of the store and of the whole domain.
    /// False when that failed: it is logged, and the changes are kept for the next time.
    virtual bool synchronize() = 0;

    /// An integer preference; missing or of another kind reads as 0.
    std::int64_t integer(const std::string& key)
    {
        const auto found = value(key);
        const auto* number = found ? found->asInteger() : nullptr;
        return number == nullptr ? 0 : *number;
    }
    /// A number, whole or not; missing or of another kind reads as 0.
    double number(const std::string& key)
    {
        const auto found = value(key);
        const auto* real = found ? found->asReal() : nullptr;
        const auto* whole = found ? found->asInteger() : nullptr;
        return real != nullptr ? *real : whole != nullptr ? static_cast<double>(*whole) : 0;
    }
    /// A dictionary preference; missing or of another kind reads as empty.
    PropertyList::Dictionary dictionary(const std::string& key)
    {
        const auto found = value(key);
        const auto* entries = found ? found->asDictionary() : nullptr;
        return entries == nullptr ? PropertyList::Dictionary{} : *entries;
    }
};

}  // namespace typhon
