#include "sample_registry.h"

namespace typhon::bench {

namespace {

PropertyList entry(int index)
{
    const auto family = "Family " + std::to_string(index / 4);
    const auto postScript = "Family" + std::to_string(index / 4) + "-Style" + std::to_string(index % 4);
    return PropertyList::Dictionary{
        {"disabled", index % 7 == 6},
        {"familyName", PropertyList::Dictionary{{postScript, family}}},
        {"registeredBy", "com.example.provider" + std::to_string(index % 20)},
        {"scope", 2},
    };
}

}  // namespace

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
    return "/var/mobile/Library/UserFonts/FontFiles/com.example.provider" + std::to_string(index % 20) +
           "/font-" + std::to_string(index) + ".ttf";
}

}  // namespace typhon::bench
