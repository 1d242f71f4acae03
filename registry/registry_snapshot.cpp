#include "registry/registry_snapshot.h"

#include "platform/font_directories.h"

#include <algorithm>
#include <iterator>

namespace typhon {

// A large registry fits no cache, and a walk over its entries costs more than anything that is done with
// each. So there is one walk, which does all there is to do.

RegistrySnapshot::RegistrySnapshot(PropertyList root)
    : root_(std::move(root)), byPostScriptName_(count()), byFamilyName_(count()), byDirectoryName_(64)
{
    PropertyList::Dictionary enabled;
    for (const auto& entry : entries()) {
        const auto& [path, contents] = entry;
        const bool isEnabled = !isDisabled(contents);
        addToIndexes(entry, isEnabled);
        if (isEnabled) {
            enabled.emplace_hint(enabled.end(), path, withoutDisabled(contents));
        }
    }
    enumerationView_ = std::move(enabled);
}

void RegistrySnapshot::addToIndexes(const Entry& entry, bool isEnabled)
{
    const auto& [path, contents] = entry;
    byDirectoryName_.add({font_directories::nameOfDirectoryHolding(path), {}, isEnabled}, entry);
    const auto* faces = contents.find("familyName");
    if (faces == nullptr) {
        return;
    }
    for (const auto& [postScriptName, family] : *faces->asDictionary()) {
        const auto& familyName = *family.asString();
        byPostScriptName_.add({postScriptName, familyName, isEnabled}, entry);
        byFamilyName_.add({familyName, familyName, isEnabled}, entry);
    }
}

std::vector<const RegistrySnapshot::Entry*>
RegistrySnapshot::entriesWithAnyFamilyName(const std::vector<std::string>& names) const
{
    std::vector<const Entry*> found;
    for (const auto& name : names) {
        std::ranges::copy(entriesWithFamilyName(name), std::back_inserter(found));
    }
    std::ranges::sort(found, {}, &Entry::first);
    found.erase(std::unique(found.begin(), found.end()), found.end());
    return found;
}

bool isDisabled(const PropertyList& entry)
{
    const auto* disabled = entry.find("disabled");
    return disabled != nullptr && disabled->isTrue();
}

PropertyList withoutDisabled(const PropertyList& entry)
{
    if (entry.find("disabled") == nullptr) {
        return entry;
    }
    PropertyList::Dictionary copy;
    for (const auto& [key, value] : *entry.asDictionary()) {
        if (key != "disabled") {
            copy.emplace_hint(copy.end(), key, value);
        }
    }
    return copy;
}

}  // namespace typhon
