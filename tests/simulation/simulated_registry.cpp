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

}  // namespace

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
        fonts_.insert_or_assign(somePath(), static_cast<State>(scheduler.pick(6)));
    }
    write();
}

void SimulatedRegistry::repair()
{
    isUnreadable_ = false;
    write();
}

std::set<std::string> SimulatedRegistry::enabled() const
{
    std::set<std::string> paths;
    for (const auto& [path, state] : fonts_) {
        if (!isUnreadable_ && (state == State::enabled || state == State::enabledWithKey)) {
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
    for (const auto& [path, state] : fonts_) {
        Dictionary entry{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}};
        if (state == State::enabledWithKey || state == State::disabled) {
            entry.emplace("disabled", state == State::disabled);
        } else if (state == State::wrongDisabled) {
            entry.emplace("disabled", "true");
        } else if (state == State::wrongFamilyName) {
            entry.insert_or_assign("familyName", "Alpha");
        }
        root.emplace(path, state == State::notADictionary ? PropertyList("?") : PropertyList(entry));
    }
    simulated_.fileSystem.addFile(registryPath, std::move(root));
    everEnabled_.merge(enabled());
}

}  // namespace typhon::simulation
