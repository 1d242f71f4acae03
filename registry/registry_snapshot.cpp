#include "registry/registry_snapshot.h"

#include "registry/font_directories.h"

namespace typhon {

namespace {

PropertyList enabledEntries(const PropertyList::Dictionary& entries)
{
    PropertyList::Dictionary enabled;
    for (const auto& [path, entry] : entries) {
        if (!isDisabled(entry)) {
            enabled.emplace_hint(enabled.end(), path, withoutDisabled(entry));
        }
    }
    return enabled;
}

}  // namespace

RegistrySnapshot::RegistrySnapshot(PropertyList root)
    : root_(std::move(root)), enumerationView_(enabledEntries(*root_.asDictionary()))
{
    for (const auto& entry : entries()) {
        const std::string directory(font_directories::nameOfDirectoryHolding(entry.first));
        byDirectoryName_[directory].push_back(&entry);
    }
}

std::span<const RegistrySnapshot::Entry* const>
RegistrySnapshot::entriesInDirectoryNamed(std::string_view name) const
{
    const auto found = byDirectoryName_.find(name);
    return found == byDirectoryName_.end() ? std::span<const Entry* const>{} : found->second;
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
    auto copy = *entry.asDictionary();
    copy.erase("disabled");
    return copy;
}

}  // namespace typhon
