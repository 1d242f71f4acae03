#pragma once

#include "platform/property_list.h"
#include "registry/name_index.h"

#include <cstddef>
#include <string>
#include <string_view>
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

    /// What the first entry, by path, that has a face of that PostScript name says of it: the face's family,
    /// and whether the entry is switched on. Null when no entry has such a face.
    const NameIndex::FirstMatch* firstWithPostScriptName(std::string_view name) const
    {
        return byPostScriptName_.find(name);
    }
    /// The same for the first entry that has a face of that family.
    const NameIndex::FirstMatch* firstWithFamilyName(std::string_view name) const
    {
        return byFamilyName_.find(name);
    }

    // All entries of a kind, by path. The pointers live as long as this.

    /// Those with a face of that PostScript name.
    std::vector<const Entry*> entriesWithPostScriptName(std::string_view name) const
    {
        return byPostScriptName_.entries(name);
    }
    /// Those with a face of that family.
    std::vector<const Entry*> entriesWithFamilyName(std::string_view name) const
    {
        return byFamilyName_.entries(name);
    }
    /// Those with a face of any of those families, each once.
    std::vector<const Entry*> entriesWithAnyFamilyName(const std::vector<std::string>& names) const;
    /// Those whose file lies in a directory of that name, wherever the directory is.
    std::vector<const Entry*> entriesInDirectoryNamed(std::string_view name) const
    {
        return byDirectoryName_.entries(name);
    }

    /// What every client that may enumerate sees: all enabled entries by path, without their "disabled". One
    /// value for all of them, so that the transport encodes it once.
    const PropertyList& enumerationView() const { return enumerationView_; }

private:
    void addToIndexes(const Entry& entry, bool isEnabled);

    PropertyList root_;
    NameIndex byPostScriptName_;
    NameIndex byFamilyName_;
    NameIndex byDirectoryName_;
    PropertyList enumerationView_;
};

/// Whether a registry entry is switched off.
bool isDisabled(const PropertyList& entry);
/// The entry as clients see it: without its "disabled".
PropertyList withoutDisabled(const PropertyList& entry);

}  // namespace typhon
