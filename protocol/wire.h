#pragma once

#include "platform/ipc.h"

/// The protocols as they stand on the wire: interface, member and argument types of every operation. A
/// member is the keyword form with inner colons as underscores and the last one dropped; the method's
/// answer is the reply block. A value that may be null is an array of none or one.
namespace typhon::wire {

/// The service that clients connect to.
inline constexpr const char* serviceName = "com.vorlan.typhond";

inline constexpr const char* typhonProtocol = "com.vorlan.typhond.TyphonProtocol";
inline constexpr const char* typhonSilkpageSupportProtocol =
    "com.vorlan.typhond.TyphonSilkpageSupportProtocol";
inline constexpr const char* typhonClientProtocol = "com.vorlan.typhond.TyphonClientProtocol";
inline constexpr const char* typhonFontPickerClientSupportProtocol =
    "com.vorlan.typhond.TyphonFontPickerClientSupportProtocol";
inline constexpr const char* typhonSilkpageSupportServerProtocol =
    "com.vorlan.typhond.TyphonSilkpageSupportServerProtocol";
inline constexpr const char* fontInstallViewServiceProtocol =
    "com.vorlan.typhond.FontInstallViewServiceProtocol";

enum class Answer { once, never };

/// One operation. Types are D-Bus signatures.
struct Operation {
    const char* interface;
    const char* member;
    const char* inTypes;
    const char* outTypes;
    Answer answer = Answer::once;
};

// Called by clients.
inline constexpr Operation checkin{typhonProtocol, "checkin", "", "aa{sv}"};
inline constexpr Operation checkinForFontPicker{typhonProtocol, "checkinForFontPicker", "", "aa{sv}"};
inline constexpr Operation requestFonts{typhonProtocol, "requestFonts_reply", "aa{sv}", "a{sv}"};
inline constexpr Operation requestFontsForClient{typhonProtocol, "requestFonts_forClient_reply", "sh", "b"};
inline constexpr Operation fontChanged{typhonProtocol, "fontChanged_reply", "a{sv}", ""};
inline constexpr Operation updatingUserFonts{typhonProtocol, "updatingUserFonts", "", ""};
inline constexpr Operation scheduleFontFilesDeletion{typhonProtocol, "scheduleFontFilesDeletion", "as", ""};
inline constexpr Operation synchronizeFontAssets{typhonProtocol, "synchronizeFontAssets_reply", "as",
                                                 "baa{sv}"};
inline constexpr Operation resetIssuedFontsFor{typhonProtocol, "resetIssuedFontsFor_reply", "s", ""};
inline constexpr Operation checkinForSilkpageProcess{typhonSilkpageSupportProtocol,
                                                     "checkinForSilkpageProcess_reply", "h", ""};
inline constexpr Operation sendFonts{typhonSilkpageSupportProtocol, "sendFonts_reply", "aa{sv}", "",
                                     Answer::never};

// Called by the daemon.
inline constexpr Operation fontAddedInfo{typhonClientProtocol,
                                         "fontAddedInfo_addedURLStrings_removedURLStrings", "aa{sv}aasaas",
                                         "", Answer::never};
inline constexpr Operation pingFontPickerClient{typhonFontPickerClientSupportProtocol, "ping_reply", "s",
                                                "s"};
inline constexpr Operation activateFontsForFontPickerClient{
    typhonFontPickerClientSupportProtocol, "activateFontsForFontPickerClient_reply", "a{sv}", "b"};
inline constexpr Operation pingSilkpageProcess{typhonSilkpageSupportServerProtocol, "ping", "", ""};
inline constexpr Operation userInstalledFontsInfo{typhonSilkpageSupportServerProtocol,
                                                  "userInstalledFontsInfo_reply", "aa{sv}", ""};

// Called by the dialog service.
inline constexpr Operation doneWithMissingFonts{fontInstallViewServiceProtocol, "doneWithMissingFonts",
                                                "aa{sv}", ""};

/// The interfaces of each protocol, built once for the process and shared by all connections.
InterfaceDescriptions typhonDaemonInterfaces();
InterfaceDescriptions typhonClientInterfaces();
InterfaceDescriptions typhonFontPickerClientSupportInterfaces();
InterfaceDescriptions typhonSilkpageSupportServerInterfaces();
InterfaceDescriptions fontInstallViewServiceInterfaces();

/// A value that may be null as it travels: an array of none or one.
PropertyList nullable(std::optional<PropertyList> value);
/// The inverse. An array of several, which no well-behaved peer sends, gives its first.
std::optional<PropertyList> fromNullable(const PropertyList& array);

}  // namespace typhon::wire
