#pragma once

#include "platform/simulated/simulated_platform.h"
#include "registry/user_font_registry.h"
#include "registry/user_font_updates.h"

#include <string>

#include <gtest/gtest.h>

namespace typhon {

inline const std::string storeOfFonts = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";
inline const std::string fontAssets = "/var/mobile/Library/UserFonts/FontAssets/";

inline PropertyList fontEntry(const std::string& name)
{
    return PropertyList::Dictionary{{"familyName", PropertyList::Dictionary{{name, name}}}};
}

/// A simulated device and what the font assets stand on.
class AssetTest : public testing::Test {
protected:
    void register_(PropertyList::Dictionary fonts)
    {
        simulated.fileSystem.addFile(UserFontRegistry::path, std::move(fonts));
        registry.invalidateUserFonts();
    }
    bool hasLogged(LogLevel level, const std::string& message) const
    {
        return simulated.log.contains(LogSink::daemon, level, message);
    }
    std::size_t synchronisations() const
    {
        std::size_t count = 0;
        for (const auto& call : simulated.userFontManager.calls()) {
            count += call == "synchronizeFontAssets" ? 1 : 0;
        }
        return count;
    }

    SimulatedPlatform simulated;
    UserFontUpdates updates{simulated.platform.processWideQueues};
    UserFontRegistry registry{simulated.fileSystem, simulated.log, updates};
};

}  // namespace typhon
