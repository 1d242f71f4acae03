#pragma once

#include "platform/property_list.h"
#include "platform/user_font_manager.h"
#include "registry/user_font_registry.h"

#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// The keys of a font request: the names that it asks for, both optional.
inline constexpr const char* kLFFontFamilyNameAttribute = "LFFontFamilyNameAttribute";
inline constexpr const char* kLFFontNameAttribute = "LFFontNameAttribute";

/// The names of a request, placed. Each once and sorted bytewise.
struct PlacedFontNames {
    std::vector<std::string> unknownFontNames;
    std::vector<std::string> enabledFamilyNames;
    /// Without those that are enabled as well.
    std::vector<std::string> disabledFamilyNames;
};

/// Who installed the fonts that a PostScript name stands for.
struct PostScriptNameProviders {
    std::set<std::string> providerIdentifiers;
    /// The family in the last entry that has the name; null when none has.
    std::optional<std::string> familyName;
};

/// Places names of fonts in the registry as it is at each call. Names are compared exactly: case counts,
/// nothing is normalised. Where several entries carry a name, the first one by path decides whether it is
/// enabled. Changes nothing; any thread, though its callers are on `mainHandlerQueue`.
class FontNameResolution {
public:
    /// Everything given outlives this.
    FontNameResolution(UserFontRegistry& registry, TYUserFontManager& userFontManager)
        : registry_(registry), userFontManager_(userFontManager)
    {}

    /// `knownFamilyNameFromPostScriptName:withEnabledState:`. The family of a PostScript name, or null. The
    /// state, if asked for, is false also when nothing was found.
    std::optional<std::string> knownFamilyNameFromPostScriptName(const std::string& name,
                                                                 bool* withEnabledState = nullptr);

    /// `isKnownFamilyName:withEnabledState:`. The same for a family name.
    bool isKnownFamilyName(const std::string& name, bool* withEnabledState = nullptr);

    /// `unknownFontNamesAndEnabledFamilyNames:andDisabledFamilyNames:fromRequests:`. Places every name of
    /// an array of request dictionaries; what is no dictionary or no string counts as absent.
    PlacedFontNames unknownFontNamesAndEnabledFamilyNames(const PropertyList::Array& fromRequests);

    /// `identifierFromFilePath:`. The application that installed a font file, by the directory it lies in;
    /// null when the directory's name is no application's.
    std::optional<std::string> identifierFromFilePath(const std::string& path);

    /// `providerIdentifiersFromFamilyName:`. Who installed files of a family, enabled or not.
    std::set<std::string> providerIdentifiersFromFamilyName(const std::string& familyName);

    /// `providerIdentifiersAndFamilyName:fromPostScriptName:`. The same for a PostScript name.
    PostScriptNameProviders providerIdentifiersAndFamilyName(const std::string& fromPostScriptName);

private:
    std::set<std::string> providersOf(const std::vector<const RegistrySnapshot::Entry*>& entries);

    UserFontRegistry& registry_;
    TYUserFontManager& userFontManager_;
};

}  // namespace typhon
