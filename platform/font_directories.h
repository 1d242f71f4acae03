#pragma once

#include <string_view>

/// The directories that fonts live in, as logical paths. Membership is a plain test for the prefix, final
/// "/" included.
namespace typhon::font_directories {

/// Fonts that applications installed, one sub-directory for each of them.
inline constexpr std::string_view fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";
/// Fonts of downloaded assets, as users may see them.
inline constexpr std::string_view fontAssets = "/var/mobile/Library/UserFonts/FontAssets/";
/// The asset store, whose files need no grant.
inline constexpr std::string_view assetStore = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";

/// The name of the directory that holds the file ("b" for "/a/b/c.ttf"), or empty for a file at the root.
constexpr std::string_view nameOfDirectoryHolding(std::string_view path)
{
    const auto end = path.rfind('/');
    if (end == std::string_view::npos) {
        return {};
    }
    const auto directory = path.substr(0, end);
    return directory.substr(directory.rfind('/') + 1);
}

}  // namespace typhon::font_directories
