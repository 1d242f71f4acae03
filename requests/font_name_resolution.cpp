#include "requests/font_name_resolution.h"

#include "platform/font_directories.h"

#include <algorithm>
#include <iterator>
#include <string_view>

// A client may ask for a hundred thousand names at once, so each costs two lookups in the registry's indexes
// and no copy before it is known to count; what repeats is dropped when all are together.

namespace typhon {

namespace {

using Match = NameIndex::FirstMatch;

const Match* firstWithPostScriptName(const RegistrySnapshot* registry, std::string_view name)
{
    return registry == nullptr ? nullptr : registry->firstWithPostScriptName(name);
}

const Match* firstWithFamilyName(const RegistrySnapshot* registry, std::string_view name)
{
    return registry == nullptr ? nullptr : registry->firstWithFamilyName(name);
}

void putEnabledState(const Match* match, bool* state)
{
    if (state != nullptr) {
        *state = match != nullptr && match->isEnabled;
    }
}

const std::string* stringOf(const PropertyList& request, std::string_view key)
{
    const auto* value = request.find(key);
    return value == nullptr ? nullptr : value->asString();
}

/// Collects names out of requests and a registry, both of which outlive it.
class Placement {
public:
    explicit Placement(const RegistrySnapshot* registry) : registry_(registry) {}

    void add(const PropertyList& request)
    {
        const auto* family = stringOf(request, kLFFontFamilyNameAttribute);
        const auto* postScript = stringOf(request, kLFFontNameAttribute);
        const auto* knownFamily = family == nullptr ? nullptr : firstWithFamilyName(registry_, *family);
        const auto* knownFace =
            postScript == nullptr ? nullptr : firstWithPostScriptName(registry_, *postScript);
        addKnown(knownFamily);
        addKnown(knownFace);
        if (knownFamily != nullptr || knownFace != nullptr) {
            return;
        }
        // The name that people know it by, where there are two.
        if (const auto* unknown = family != nullptr ? family : postScript) {
            unknown_.emplace_back(*unknown);
        }
    }

    PlacedFontNames take()
    {
        keepOneOfEach(unknown_);
        keepOneOfEach(enabled_);
        keepOneOfEach(disabled_);
        Names disabledOnly;
        std::ranges::set_difference(disabled_, enabled_, std::back_inserter(disabledOnly));
        return {{unknown_.begin(), unknown_.end()},
                {enabled_.begin(), enabled_.end()},
                {disabledOnly.begin(), disabledOnly.end()}};
    }

private:
    using Names = std::vector<std::string_view>;

    void addKnown(const Match* match)
    {
        if (match != nullptr) {
            (match->isEnabled ? enabled_ : disabled_).push_back(match->familyName);
        }
    }

    static void keepOneOfEach(Names& names)
    {
        std::ranges::sort(names);
        names.erase(std::unique(names.begin(), names.end()), names.end());
    }

    const RegistrySnapshot* registry_;
    Names unknown_;
    Names enabled_;
    Names disabled_;
};

}  // namespace

std::optional<std::string> FontNameResolution::knownFamilyNameFromPostScriptName(const std::string& name,
                                                                                 bool* withEnabledState)
{
    const auto registry = registry_.userFontsInfo();
    const auto* match = firstWithPostScriptName(registry.get(), name);
    putEnabledState(match, withEnabledState);
    return match == nullptr ? std::nullopt : std::optional(std::string(match->familyName));
}

bool FontNameResolution::isKnownFamilyName(const std::string& name, bool* withEnabledState)
{
    const auto registry = registry_.userFontsInfo();
    const auto* match = firstWithFamilyName(registry.get(), name);
    putEnabledState(match, withEnabledState);
    return match != nullptr;
}

PlacedFontNames
FontNameResolution::unknownFontNamesAndEnabledFamilyNames(const PropertyList::Array& fromRequests)
{
    const auto registry = registry_.userFontsInfo();
    Placement placement(registry.get());
    for (const auto& request : fromRequests) {
        placement.add(request);
    }
    return placement.take();
}

std::optional<std::string> FontNameResolution::identifierFromFilePath(const std::string& path)
{
    return userFontManager_.identifierFromDirectoryName(
        std::string(font_directories::nameOfDirectoryHolding(path)));
}

std::set<std::string>
FontNameResolution::providersOf(const std::vector<const RegistrySnapshot::Entry*>& entries)
{
    std::set<std::string> identifiers;
    for (const auto* entry : entries) {
        if (auto identifier = identifierFromFilePath(entry->first)) {
            identifiers.insert(*std::move(identifier));
        }
    }
    return identifiers;
}

std::set<std::string> FontNameResolution::providerIdentifiersFromFamilyName(const std::string& familyName)
{
    const auto registry = registry_.userFontsInfo();
    return registry ? providersOf(registry->entriesWithFamilyName(familyName)) : std::set<std::string>{};
}

PostScriptNameProviders
FontNameResolution::providerIdentifiersAndFamilyName(const std::string& fromPostScriptName)
{
    const auto registry = registry_.userFontsInfo();
    if (!registry || registry->firstWithPostScriptName(fromPostScriptName) == nullptr) {
        return {};
    }
    const auto entries = registry->entriesWithPostScriptName(fromPostScriptName);
    // Intended: unlike elsewhere the last entry says which family it is.
    const auto* family = entries.back()->second.find("familyName")->find(fromPostScriptName);
    return {providersOf(entries), *family->asString()};
}

}  // namespace typhon
