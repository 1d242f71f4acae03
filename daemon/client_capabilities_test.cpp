#include "daemon/client_capabilities.h"
#include "platform/simulated/simulated_platform.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

const std::string app = "com.example.app";

class ClientCapabilitiesTest : public testing::Test {
protected:
    Capabilities capabilitiesWith(PropertyList userFonts, std::optional<std::string> identifier = app)
    {
        return capabilities.capabilitiesFor(simulated.processes.add(
            {.signingIdentifier = std::move(identifier),
             .entitlements = {{"com.vorlan.developer.user-fonts", std::move(userFonts)}}}));
    }
    void prohibit(Array versions)
    {
        capabilities.setFontEnumerationProhibitedInfo(Array{Dictionary{{app, std::move(versions)}}});
    }
    bool isPickerWith(std::optional<std::string> identifier)
    {
        const auto token = simulated.processes.add({.signingIdentifier = std::move(identifier)});
        bool answer = false;
        simulated.runAs(token, [&] { answer = capabilities.isCurrentConnectionFontPicker(); });
        return answer;
    }

    SimulatedPlatform simulated;
    ClientCapabilities capabilities{simulated.platform};
};

void expectNothingAllowed(const Capabilities& result)
{
    EXPECT_FALSE(result.allowEnumerate);
    EXPECT_FALSE(result.allowUserFonts);
    EXPECT_FALSE(result.allowInstallation);
}

TEST_F(ClientCapabilitiesTest, AllThreeStringsGiveAllThreeCapabilitiesIndependently)
{
    const auto all = capabilitiesWith(Array{"font-enumeration", "app-usage", "system-installation"});
    EXPECT_TRUE(all.allowEnumerate);
    EXPECT_TRUE(all.allowUserFonts);
    EXPECT_TRUE(all.allowInstallation);
    EXPECT_EQ(all.identifier, app);

    const auto usage = capabilitiesWith(Array{"app-usage", 7, "something else"});
    EXPECT_FALSE(usage.allowEnumerate);
    EXPECT_TRUE(usage.allowUserFonts);
    EXPECT_FALSE(usage.allowInstallation);

    const auto installation = capabilitiesWith(Array{"system-installation"});
    EXPECT_FALSE(installation.allowEnumerate);
    EXPECT_FALSE(installation.allowUserFonts);
    EXPECT_TRUE(installation.allowInstallation);

    const auto enumeration = capabilitiesWith(Array{"font-enumeration"});
    EXPECT_TRUE(enumeration.allowEnumerate);
    EXPECT_FALSE(enumeration.allowUserFonts);
    EXPECT_FALSE(enumeration.allowInstallation);
}

TEST_F(ClientCapabilitiesTest, ASingleStringInsteadOfAnArrayGrantsNothing)
{
    expectNothingAllowed(capabilitiesWith("font-enumeration"));
    expectNothingAllowed(capabilitiesWith(Dictionary{{"font-enumeration", true}}));
    expectNothingAllowed(capabilitiesWith(Array{Array{"font-enumeration"}}));
}

TEST_F(ClientCapabilitiesTest, StringsMustMatchAsAWhole)
{
    expectNothingAllowed(capabilitiesWith(Array{"font-enumeration ", "App-usage", "system"}));
}

TEST_F(ClientCapabilitiesTest, EnumerationNeedsASigningIdentifierTheOthersDoNot)
{
    const auto result =
        capabilitiesWith(Array{"font-enumeration", "app-usage", "system-installation"}, std::nullopt);
    EXPECT_FALSE(result.allowEnumerate);
    EXPECT_TRUE(result.allowUserFonts);
    EXPECT_TRUE(result.allowInstallation);
    EXPECT_EQ(result.identifier, std::nullopt);
}

TEST_F(ClientCapabilitiesTest, AProcessWithoutTheEntitlementIsStillNamed)
{
    const auto result = capabilities.capabilitiesFor(simulated.processes.add({.signingIdentifier = app}));
    expectNothingAllowed(result);
    EXPECT_EQ(result.identifier, app);
}

TEST_F(ClientCapabilitiesTest, AProcessThatIsGoneHasNothing)
{
    const auto token = simulated.processes.add(
        {.signingIdentifier = app,
         .entitlements = {{"com.vorlan.developer.user-fonts", Array{"font-enumeration", "app-usage"}}}});
    simulated.processes.exit(token);
    const auto result = capabilities.capabilitiesFor(token);
    expectNothingAllowed(result);
    EXPECT_EQ(result.identifier, std::nullopt);
}

TEST_F(ClientCapabilitiesTest, TheListedVersionsAreBarredAndOthersAllowed)
{
    prohibit({"2.0", "2.1"});
    simulated.applicationRegistry.install({app, "2.1", false});
    EXPECT_FALSE(capabilities.isIdentifierAllowedForFontEnumeration(app));
    const auto barred = capabilitiesWith(Array{"font-enumeration", "app-usage"});
    EXPECT_FALSE(barred.allowEnumerate);
    EXPECT_TRUE(barred.allowUserFonts);

    simulated.applicationRegistry.install({app, "2.2", false});
    EXPECT_TRUE(capabilities.isIdentifierAllowedForFontEnumeration(app));
    EXPECT_TRUE(capabilitiesWith(Array{"font-enumeration"}).allowEnumerate);
}

TEST_F(ClientCapabilitiesTest, ARefusalByThePrivacyListIsLogged)
{
    prohibit({"2.0"});
    simulated.applicationRegistry.install({app, "2.0", false});
    capabilitiesWith(Array{"font-enumeration"});
    EXPECT_EQ(simulated.log.count(LogSink::system, LogLevel::defaultLevel,
                                  "This process is not allowed to enumerate fonts - " + app),
              1U);
    EXPECT_EQ(simulated.log.entries().size(), 1U);
}

TEST_F(ClientCapabilitiesTest, ThePrivacyListIsOnlyAskedAboutClientsThatWantToEnumerate)
{
    prohibit({"2.0"});
    simulated.applicationRegistry.install({app, "2.0", false});
    capabilitiesWith(Array{"app-usage"});
    EXPECT_TRUE(simulated.log.entries().empty());
}

TEST_F(ClientCapabilitiesTest, ApplicationsThatAreNotInstalledHaveNoVersionAndAreNotBarred)
{
    prohibit({"2.0"});
    EXPECT_TRUE(capabilities.isIdentifierAllowedForFontEnumeration(app));
    simulated.applicationRegistry.install({app, "2.0", true});
    EXPECT_TRUE(capabilities.isIdentifierAllowedForFontEnumeration(app));
    simulated.applicationRegistry.install({app, std::nullopt, false});
    EXPECT_TRUE(capabilities.isIdentifierAllowedForFontEnumeration(app));
}

TEST_F(ClientCapabilitiesTest, EveryDictionaryOfThePrivacyListCounts)
{
    capabilities.setFontEnumerationProhibitedInfo(Array{Dictionary{{app, Array{"1.0"}}}, "no dictionary",
                                                        Dictionary{{app, Array{"2.0"}}},
                                                        Dictionary{{"com.example.other", Array{"3.0"}}}});
    const auto isAllowedAt = [&](const std::string& version) {
        simulated.applicationRegistry.install({app, version, false});
        return capabilities.isIdentifierAllowedForFontEnumeration(app);
    };
    EXPECT_FALSE(isAllowedAt("1.0"));
    EXPECT_FALSE(isAllowedAt("2.0"));
    EXPECT_TRUE(isAllowedAt("3.0"));
}

TEST_F(ClientCapabilitiesTest, ANullPrivacyListBarsNobody)
{
    simulated.applicationRegistry.install({app, "2.0", false});
    EXPECT_EQ(capabilities.fontEnumerationProhibitedInfo(), std::nullopt);
    EXPECT_TRUE(capabilities.isIdentifierAllowedForFontEnumeration(app));
    prohibit({"2.0"});
    capabilities.setFontEnumerationProhibitedInfo(std::nullopt);
    EXPECT_TRUE(capabilities.isIdentifierAllowedForFontEnumeration(app));
}

TEST_F(ClientCapabilitiesTest, VersionsThatAreNoArrayBarNobody)
{
    simulated.applicationRegistry.install({app, "2.0", false});
    capabilities.setFontEnumerationProhibitedInfo(Array{Dictionary{{app, "2.0"}}});
    EXPECT_TRUE(capabilities.isIdentifierAllowedForFontEnumeration(app));
}

TEST_F(ClientCapabilitiesTest, TheSandboxTestAsksThePlatform)
{
    EXPECT_TRUE(capabilities.isAuditTokenSandboxed(simulated.processes.add({.isSandboxed = true})));
    EXPECT_FALSE(capabilities.isAuditTokenSandboxed(simulated.processes.add({.isSandboxed = false})));
    EXPECT_TRUE(capabilities.isAuditTokenSandboxed(AuditToken{}));
}

TEST_F(ClientCapabilitiesTest, TheFontPickerIsKnownByItsTwoIdentifiers)
{
    EXPECT_TRUE(isPickerWith("com.vorlan.Panekit.FontPickerUIService"));
    EXPECT_TRUE(isPickerWith("com.vorlan.Panekit.FontPicker"));
    EXPECT_FALSE(isPickerWith("com.vorlan.Panekit.FontPicker2"));
    EXPECT_FALSE(isPickerWith(app));
    EXPECT_FALSE(isPickerWith(std::nullopt));
}

TEST_F(ClientCapabilitiesTest, WithoutACurrentConnectionNobodyIsTheFontPicker)
{
    simulated.processes.set(AuditToken{.processInstance = 99},
                            {.signingIdentifier = "com.vorlan.Panekit.FontPicker"});
    EXPECT_FALSE(capabilities.isCurrentConnectionFontPicker());
}

}  // namespace
}  // namespace typhon
