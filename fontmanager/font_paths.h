#pragma once

#include <optional>
#include <string>
#include <string_view>

/// Where the font-registry library keeps things: logical paths, below the root of the system.
namespace typhon::font_paths {

inline constexpr const char* userFonts = "/var/mobile/Library/UserFonts";
/// One directory for each provider, with its font files.
inline constexpr const char* fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";
/// The registry: font path to entry.
inline constexpr const char* registry = "/var/mobile/Library/UserFonts/UserFonts.plist";
/// What a change that was interrupted still has to do.
inline constexpr const char* journal = "/var/mobile/Library/UserFonts/UserFonts.plist.pending";
/// There while the registry may have been replaced without anybody hearing of it.
inline constexpr const char* unreported = "/var/mobile/Library/UserFonts/UserFonts.plist.unreported";
/// Held by the one process that changes fonts.
inline constexpr const char* writerLock = "/var/mobile/Library/UserFonts/UserFonts.plist.writer";
/// Fonts that came with a profile, put there by whoever installs profiles.
inline constexpr const char* managedFonts = "/var/mobile/Library/Fonts/Managed/";
/// The record of those fonts, in the form of the registry.
inline constexpr const char* profileFonts = "/var/mobile/Library/UserFonts/ProfileFonts.plist";

/// The logical path of the directory of an application's font files, or null for an identifier without one.
std::optional<std::string> fontDirectoryOfProvider(std::string_view identifier);

/// A font file's place in the directories of the providers.
struct FontFilePlace {
    std::string directory;
    std::string name;
};

/// Null for whatever is not the path of a file directly in a provider's directory.
std::optional<FontFilePlace> placeOfFontFile(std::string_view path);

/// Why a font file may not be installed under that name, or null when it may: one plain, visible component of
/// at most 255 bytes that ends like a font's and does not begin with a dot.
std::optional<std::string> objectionToFontFileName(std::string_view name);

/// The same for how a file name ends: .ttf, .otf, .ttc or .otc in either case.
bool endsLikeAFont(std::string_view name);

}  // namespace typhon::font_paths
