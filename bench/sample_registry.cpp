#include "sample_registry.h"

namespace typhon::bench {

namespace {

PropertyList entry(int index)
{
    return PropertyList::Dictionary{
        {"disabled", index % 7 == 6},
        {"familyName", PropertyList::Dictionary{{samplePostScriptName(index), sampleFamilyName(index)}}},
        {"registeredBy", sampleProvider(index % sampleProviders)},
        {"scope", 2},
    };
}

}  // namespace

std::string sampleProvider(int number)
{
    return "com.example.provider" + std::to_string(number);
}

PropertyList sampleRegistry(int fonts)
{
    PropertyList::Dictionary entries;
    for (int index = 0; index < fonts; ++index) {
        entries.emplace(sampleFontPath(index), entry(index));
    }
    return entries;
}

std::string sampleFontPath(int index)
{
    return "/var/mobile/Library/UserFonts/FontFiles/" + sampleProvider(index % sampleProviders) + "/font-" +
           std::to_string(index) + ".ttf";
}

std::string sampleFamilyName(int index)
{
    return "Family " + std::to_string(index / 4);
}

std::string samplePostScriptName(int index)
{
    return "Family" + std::to_string(index / 4) + "-Style" + std::to_string(index % 4);
}

}  // namespace typhon::bench
