#pragma once

#include "platform/property_list.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {

/// Which registry entries carry a name, for names of one kind. Refers to the names and entries of a registry
/// that outlives it. Filled once, in the order of the registry; then any thread may read it.
class NameIndex {
public:
    /// Path and entry.
    using Entry = PropertyList::Dictionary::value_type;

    /// What the first entry that carries a name says of it.
    struct FirstMatch {
        std::string_view name;
        /// The family that goes with the name there.
        std::string_view familyName;
        bool isEnabled = false;
    };

    /// Makes room for that many names; more may come.
    explicit NameIndex(std::size_t expectedNames);

    /// Adds an entry under a name, once however often it is added. `match` is kept for the first entry of a
    /// name only.
    void add(const FirstMatch& match, const Entry& entry);

    /// Null for a name that no entry carries. The pointer lives as long as the index.
    const FirstMatch* find(std::string_view name) const;
    /// All entries that carry the name, in the order of the registry.
    std::vector<const Entry*> entries(std::string_view name) const;

private:
    static constexpr std::uint32_t none = UINT32_MAX;

    /// One entry of a name, and the place of the next one.
    struct Occurrence {
        const Entry* entry;
        std::uint32_t next;
    };
    struct Record {
        FirstMatch match;
        std::uint32_t firstOccurrence;
        std::uint32_t lastOccurrence;
    };
    /// Part of the name's hash, and the place of its record.
    struct Slot {
        std::uint32_t hash = 0;
        std::uint32_t record = none;
    };

    static std::uint32_t hashOf(std::string_view name);
    /// The slot that holds the name, or the free one where it belongs.
    std::size_t slotOf(std::string_view name, std::uint32_t hash) const;
    std::uint32_t recordOf(std::string_view name) const;
    void grow();

    /// A power of two of them, at most half in use.
    std::vector<Slot> slots_;
    std::vector<Record> records_;
    std::vector<Occurrence> occurrences_;
};

}  // namespace typhon
