#include "sdk/font_grant.h"

#include <array>
#include <optional>
#include <string_view>

namespace typhon {

namespace {

constexpr std::string_view fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";
constexpr std::string_view fontAssets = "/var/mobile/Library/UserFonts/FontAssets/";
/// Directories whose files every identified process may have.
constexpr std::array<std::string_view, 2> needNoGrant{
    "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/",
    "/var/mobile/Library/Fonts/Managed/",
};

std::optional<FontGrant> grantUnder(const PropertyList& dictionary, std::string_view key)
{
    const auto* value = dictionary.find(key);
    const auto* data = value == nullptr ? nullptr : value->asData();
    return data == nullptr ? std::nullopt : std::optional(FontGrant{FontGrant::Way::broker, *data, key});
}

const PropertyList* entryOf(const PropertyList& checkin, const std::string& path)
{
    const auto* fonts = checkin.find("fontsInfo");
    return fonts == nullptr ? nullptr : fonts->find(path);
}

/// The grant of the directory that holds the file. A provider's is for its own directory only; which one
/// that is, the broker knows.
std::optional<FontGrant> directoryGrant(const PropertyList& checkin, const std::string& path)
{
    if (path.starts_with(fontFiles)) {
        auto grant = grantUnder(checkin, "extension.provider");
        return grant ? grant : grantUnder(checkin, "extension");
    }
    return path.starts_with(fontAssets) ? grantUnder(checkin, "extension.fontasset") : std::nullopt;
}

bool needsNoGrant(const std::string& path)
{
    for (const auto prefix : needNoGrant) {
        if (path.starts_with(prefix)) {
            return true;
        }
    }
    return false;
}

}  // namespace

FontGrant fontGrantFor(const PropertyList& checkin, const std::string& path)
{
    const auto* entry = entryOf(checkin, path);
    auto grant = entry == nullptr ? std::nullopt : grantUnder(*entry, "data");
    if (!grant) {
        grant = directoryGrant(checkin, path);
    }
    if (grant) {
        return std::move(*grant);
    }
    using Way = FontGrant::Way;
    return {entry == nullptr || needsNoGrant(path) ? Way::broker : Way::ownAccess, {}, {}};
}

}  // namespace typhon
