#pragma once

#include "protocol/wire.h"

/// The service of the font-registry library's helper as it stands on the wire.
namespace typhon::font_registry_wire {

inline constexpr const char* serviceName = "com.vorlan.Typhon.UserFontManager";
inline constexpr const char* interface = "com.vorlan.typhond.UserFontManager";

/// Begins a registration on this connection, which has one at a time: the provider's identifier (empty: the
/// caller's own), and whether the fonts are switched on.
inline constexpr wire::Operation beginRegistration{interface, "beginRegistrationForIdentifier_enabled", "sb",
                                                   ""};
/// A font file of it and the name it gets; gives how many have been taken. An error ends the registration.
inline constexpr wire::Operation addFontFile{interface, "addFontFile_named", "hs", "x"};
/// Registers all files that were added; gives their paths.
inline constexpr wire::Operation commitRegistration{interface, "commitRegistration", "", "as"};
inline constexpr wire::Operation cancelRegistration{interface, "cancelRegistration", "", ""};
/// File URLs. Give how many fonts are other now.
inline constexpr wire::Operation unregister{interface, "unregisterPersistentURLs", "as", "x"};
inline constexpr wire::Operation unregisterAll{
    interface, "unregisterAndRemoveFontFilesForIdentifier_completionHandler", "s", "x"};
inline constexpr wire::Operation enableOrDisable{interface, "enableOrDisablePersistentURLs_enabled", "asb",
                                                 "x"};
inline constexpr wire::Operation synchronizeFontProviders{interface, "synchronizeFontProviders", "", ""};
inline constexpr wire::Operation synchronizeProfileFonts{interface, "synchronizeProfileFonts", "", ""};
inline constexpr wire::Operation synchronizeFontAssets{interface, "synchronizeFontAssets", "", ""};

}  // namespace typhon::font_registry_wire
