#include "registry/name_index.h"

#include <bit>
#include <functional>

// A flat hash table with linear probing: a lookup touches one slot, one record and the name itself, and
// building it costs a handful of allocations, not some for each name. Most names stand in one or a few
// entries, so the entries of a name are a list threaded through one array.

namespace typhon {

NameIndex::NameIndex(std::size_t expectedNames) : slots_(std::bit_ceil(2 * expectedNames + 2))
{
    records_.reserve(expectedNames);
    occurrences_.reserve(expectedNames);
}

void NameIndex::add(const FirstMatch& match, const Entry& entry)
{
    const auto hash = hashOf(match.name);
    const auto place = slotOf(match.name, hash);
    const auto added = static_cast<std::uint32_t>(occurrences_.size());
    if (slots_[place].record == none) {
        slots_[place] = {hash, static_cast<std::uint32_t>(records_.size())};
        records_.push_back({match, added, added});
        occurrences_.push_back({&entry, none});
        if (2 * records_.size() > slots_.size()) {
            grow();
        }
        return;
    }
    auto& record = records_[slots_[place].record];
    // All names of one entry are added before those of the next.
    if (occurrences_[record.lastOccurrence].entry != &entry) {
        occurrences_[record.lastOccurrence].next = added;
        record.lastOccurrence = added;
        occurrences_.push_back({&entry, none});
    }
}

const NameIndex::FirstMatch* NameIndex::find(std::string_view name) const
{
    const auto record = recordOf(name);
    return record == none ? nullptr : &records_[record].match;
}

std::vector<const NameIndex::Entry*> NameIndex::entries(std::string_view name) const
{
    std::vector<const Entry*> found;
    const auto record = recordOf(name);
    auto next = record == none ? none : records_[record].firstOccurrence;
    for (; next != none; next = occurrences_[next].next) {
        found.push_back(occurrences_[next].entry);
    }
    return found;
}

std::uint32_t NameIndex::hashOf(std::string_view name)
{
    return static_cast<std::uint32_t>(std::hash<std::string_view>()(name));
}

std::size_t NameIndex::slotOf(std::string_view name, std::uint32_t hash) const
{
    const auto mask = slots_.size() - 1;
    auto place = hash & mask;
    while (slots_[place].record != none &&
           (slots_[place].hash != hash || records_[slots_[place].record].match.name != name)) {
        place = (place + 1) & mask;
    }
    return place;
}

std::uint32_t NameIndex::recordOf(std::string_view name) const
{
    return slots_[slotOf(name, hashOf(name))].record;
}

void NameIndex::grow()
{
    const auto mask = 2 * slots_.size() - 1;
    std::vector<Slot> larger(2 * slots_.size());
    for (const auto& slot : slots_) {
        if (slot.record == none) {
            continue;
        }
        auto place = slot.hash & mask;
        while (larger[place].record != none) {
            place = (place + 1) & mask;
        }
        larger[place] = slot;
    }
    slots_.swap(larger);
}

}  // namespace typhon
