#include "simulation/simulated_registry.h"

#include <array>

namespace typhon::simulation {

namespace {

using Dictionary = PropertyList::Dictionary;

constexpr const char* registryPath = "/var/mobile/Library/UserFonts/UserFonts.plist";

constexpr std::array directories{
    "/var/mobile/Library/UserFonts/FontFiles/com.example.provider/",
    "/var/mobile/Library/UserFonts/FontFiles/com.example.suite/",
    "/var/mobile/Library/UserFonts/FontFiles/com.example.other/",
    "/var/mobile/Library/UserFonts/FontAssets/abc.asset/",
    "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/abc.asset/AssetData/",
};

/// PostScript name to family.
const std::vector<Dictionary>& faceSets()
{
    static const std::vector<Dictionary> sets{
        {{"Alpha-Regular", "Alpha"}},
        {{"Beta-Regular", "Beta"}},
        {{"Alpha-Bold", "Alpha"}, {"Beta-Bold", "Beta"}},
        // Two files that disagree about a face.
        {{"Alpha-Regular", "Beta"}},
    };
    return sets;
}

}  // namespace

const std::vector<std::string>& SimulatedRegistry::familyNames()
{
    static const std::vector<std::string> names{"Alpha", "Beta"};
    return names;
}

const std::vector<std::string>& SimulatedRegistry::postScriptNames()
{
    static const std::vector<std::string> names{"Alpha-Regular", "Alpha-Bold", "Beta-Regular", "Beta-Bold"};
    return names;
}

std::set<std::string> SimulatedRegistry::familiesOf(const std::string& postScriptName)
{
    std::set<std::string> families;
    for (const auto& faces : faceSets()) {
        const auto found = faces.find(postScriptName);
        if (found != faces.end()) {
            families.insert(*found->second.asString());
        }
    }
    return families;
}

std::string SimulatedRegistry::somePath()
{
    auto& scheduler = simulated_.scheduler;
    return directories[scheduler.pick(directories.size())] + std::to_string(scheduler.pick(2)) + ".ttf";
}

void SimulatedRegistry::changeSomething()
{
    auto& scheduler = simulated_.scheduler;
    isUnreadable_ = scheduler.pick(12) == 0;
    if (scheduler.pick(4) == 0) {
        fonts_.erase(somePath());
    } else {
        const auto path = somePath();
        const auto state = static_cast<State>(scheduler.pick(6));
        fonts_.insert_or_assign(path, Font{state, scheduler.pick(faceSets().size())});
    }
    write();
}

void SimulatedRegistry::repair()
{
    isUnreadable_ = false;
    write();
}

void SimulatedRegistry::continueFrom(const SimulatedRegistry& other)
{
    fonts_ = other.fonts_;
    isUnreadable_ = other.isUnreadable_;
    everEnabled_ = other.everEnabled_;
    everEnabledWith_ = other.everEnabledWith_;
    everDisabledWith_ = other.everDisabledWith_;
    write();
}

std::set<std::string> SimulatedRegistry::enabled() const
{
    std::set<std::string> paths;
    for (const auto& [path, font] : fonts_) {
        if (!isUnreadable_ && (font.state == State::enabled || font.state == State::enabledWithKey)) {
            paths.insert(path);
        }
    }
    return paths;
}

void SimulatedRegistry::write()
{
    if (isUnreadable_) {
        simulated_.fileSystem.addMalformedFile(registryPath);
        return;
    }
    Dictionary root;
    for (const auto& [path, font] : fonts_) {
        root.emplace(path, entryOf(font));
        remember(path, font);
    }
    simulated_.fileSystem.addFile(registryPath, std::move(root));
    everEnabled_.merge(enabled());
}

PropertyList SimulatedRegistry::entryOf(const Font& font)
{
    Dictionary entry{{"familyName", faceSets()[font.faces]}};
    switch (font.state) {
    case State::enabledWithKey:
    case State::disabled:
        entry.emplace("disabled", font.state == State::disabled);
        break;
    case State::wrongDisabled:
        entry.emplace("disabled", "true");
        break;
    case State::wrongFamilyName:
        entry.insert_or_assign("familyName", "Alpha");
        break;
    case State::notADictionary:
        return "?";
    case State::enabled:
        break;
    }
    return entry;
}

void SimulatedRegistry::remember(const std::string& path, const Font& font)
{
    const bool isEnabled = font.state == State::enabled || font.state == State::enabledWithKey;
    if (!isEnabled && font.state != State::disabled) {
        return;
    }
    for (const auto& [postScriptName, family] : faceSets()[font.faces]) {
        (isEnabled ? everEnabledWith_ : everDisabledWith_).emplace(path, *family.asString());
    }
}

}  // namespace typhon::simulation
