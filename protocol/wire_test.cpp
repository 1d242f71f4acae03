#include "protocol/font_install_view_service_protocol.h"
#include "protocol/typhon_client_protocol.h"
#include "protocol/typhon_daemon_protocol.h"
#include "protocol/typhon_font_picker_client_support_protocol.h"
#include "protocol/typhon_silkpage_support_server_protocol.h"
#include "protocol/wire.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

std::vector<std::string> rowsOf(const InterfaceDescriptions& interfaces)
{
    std::vector<std::string> rows;
    for (const auto& interface : *interfaces) {
        for (const auto& member : interface.members) {
            rows.push_back(interface.name + "." + member.name + "(" + member.inTypes + ")" +
                           (member.replies ? "(" + member.outTypes + ")" : ""));
        }
    }
    return rows;
}

TEST(Wire, TheDaemonExportsBothProtocolsWithTheAgreedTypes)
{
    const std::string typhon = "com.vorlan.typhond.TyphonProtocol.";
    const std::string silkpage = "com.vorlan.typhond.TyphonSilkpageSupportProtocol.";
    EXPECT_EQ(rowsOf(wire::typhonDaemonInterfaces()), (std::vector<std::string>{
                                                          typhon + "checkin()(aa{sv})",
                                                          typhon + "checkinForFontPicker()(aa{sv})",
                                                          typhon + "requestFonts_reply(aa{sv})(a{sv})",
                                                          typhon + "requestFonts_forClient_reply(sh)(b)",
                                                          typhon + "fontChanged_reply(a{sv})()",
                                                          typhon + "updatingUserFonts()()",
                                                          typhon + "scheduleFontFilesDeletion(as)()",
                                                          typhon + "synchronizeFontAssets_reply(as)(baa{sv})",
                                                          typhon + "resetIssuedFontsFor_reply(s)()",
                                                          silkpage + "checkinForSilkpageProcess_reply(h)()",
                                                          silkpage + "sendFonts_reply(aa{sv})",
                                                      }));
}

TEST(Wire, TheProtocolsThatTheDaemonCallsHaveTheAgreedTypes)
{
    const std::string prefix = "com.vorlan.typhond.";
    EXPECT_EQ(
        rowsOf(wire::typhonClientInterfaces()),
        (std::vector<std::string>{prefix + "TyphonClientProtocol."
                                           "fontAddedInfo_addedURLStrings_removedURLStrings(aa{sv}aasaas)"}));
    EXPECT_EQ(rowsOf(wire::typhonFontPickerClientSupportInterfaces()),
              (std::vector<std::string>{prefix + "TyphonFontPickerClientSupportProtocol.ping_reply(s)(s)",
                                        prefix + "TyphonFontPickerClientSupportProtocol."
                                                 "activateFontsForFontPickerClient_reply(a{sv})(b)"}));
    EXPECT_EQ(rowsOf(wire::typhonSilkpageSupportServerInterfaces()),
              (std::vector<std::string>{
                  prefix + "TyphonSilkpageSupportServerProtocol.ping()()",
                  prefix + "TyphonSilkpageSupportServerProtocol.userInstalledFontsInfo_reply(aa{sv})()"}));
    EXPECT_EQ(
        rowsOf(wire::fontInstallViewServiceInterfaces()),
        (std::vector<std::string>{prefix + "FontInstallViewServiceProtocol.doneWithMissingFonts(aa{sv})()"}));
}

TEST(Wire, TheDescriptionsAreBuiltOnceAndShared)
{
    EXPECT_EQ(wire::typhonDaemonInterfaces(), wire::typhonDaemonInterfaces());
    EXPECT_EQ(wire::typhonClientInterfaces(), wire::typhonClientInterfaces());
}

TEST(Wire, NullTravelsAsAnEmptyArrayAndAValueAsAnArrayOfOne)
{
    EXPECT_EQ(wire::nullable(std::nullopt), PropertyList(PropertyList::Array{}));
    EXPECT_EQ(wire::nullable(PropertyList("a")), PropertyList(PropertyList::Array{"a"}));
    EXPECT_EQ(wire::fromNullable(PropertyList::Array{}), std::nullopt);
    EXPECT_EQ(wire::fromNullable(PropertyList::Array{"a"}), PropertyList("a"));
}

}  // namespace
}  // namespace typhon
