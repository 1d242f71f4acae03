#pragma once

#include "platform/property_list.h"

#include <cstddef>
#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace typhon {

/// One load of the registry with what is derived from it, all computed once. Immutable: any thread.
class RegistrySnapshot {
public:
    /// Path and entry.
    using Entry = PropertyList::Dictionary::value_type;

    /// `root` is a dictionary that was cleaned.
    explicit RegistrySnapshot(PropertyList root);
    RegistrySnapshot(const RegistrySnapshot&) = delete;
    RegistrySnapshot& operator=(const RegistrySnapshot&) = delete;

    /// Every entry by path, disabled ones included.
    const PropertyList::Dictionary& entries() const { return *root_.asDictionary(); }
    std::size_t count() const { return entries().size(); }
    /// The entry of a path, or null.
    const PropertyList* entry(std::string_view path) const { return root_.find(path); }

    /// The entries whose file lies in a directory of that name, wherever the directory is, by path.
    std::span<const Entry* const> entriesInDirectoryNamed(std::string_view name) const;

    /// What every client that may enumerate sees: all enabled entries by path, without their "disabled". One
    /// value for all of them, so that the transport encodes it once.
    const PropertyList& enumerationView() const { return enumerationView_; }

private:
    struct Hash : std::hash<std::string_view> {
        using is_transparent = void;
    };
    // Further indexes (PostScript name and family name to entries) belong here, built by the constructor.
    using Index = std::unordered_map<std::string, std::vector<const Entry*>, Hash, std::equal_to<>>;

    PropertyList root_;
    Index byDirectoryName_;
    PropertyList enumerationView_;
};

/// Whether a registry entry is switched off.
bool isDisabled(const PropertyList& entry);
/// The entry as clients see it: without its "disabled".
PropertyList withoutDisabled(const PropertyList& entry);

}  // namespace typhon
