#include "platform/simulated/simulated_platform.h"
#include "registry/per_client_font_info.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;

const std::string fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";
const std::string fontAssets = "/var/mobile/Library/UserFonts/FontAssets/";
const std::string assetFile =
    "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/abc.asset/AssetData/a.ttf";
const std::string ownFont = fontFiles + "com.example.provider/own.ttf";
const std::string otherFont = fontFiles + "com.example.other/other.ttf";

PropertyList font()
{
    return Dictionary{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}};
}

PropertyList fontWith(const char* key, PropertyList value)
{
    auto entry = *font().asDictionary();
    entry.insert_or_assign(key, std::move(value));
    return entry;
}

PropertyList dataOf(const std::string& text)
{
    Data data{{text.begin(), text.end()}};
    data.bytes.push_back(0);
    return data;
}

class PerClientFontInfoTest : public testing::Test {
protected:
    struct Client {
        AuditToken token;
        bool hasEnumeration = false;
        bool hasFontAccess = false;
        bool isFontProvider = false;
        std::optional<std::string> identifier = "com.example.provider";
    };

    void install(const std::string& path, PropertyList entry = font())
    {
        fonts.insert_or_assign(path, std::move(entry));
        registry.setUserFontsInfo(fonts);
    }
    AuditToken sandboxed(std::set<std::string> readablePaths = {})
    {
        return simulated.processes.add({.readablePaths = std::move(readablePaths)});
    }
    /// A process outside of any sandbox, which can read everything.
    AuditToken unsandboxed()
    {
        return simulated.processes.add(
            {.isSandboxed = false,
             .readablePaths = {ownFont, otherFont, fontFiles + "com.example.provider", fontAssets}});
    }

    /// The reply to a check-in; the outer value is null when there was none.
    std::optional<std::optional<PropertyList>> answer(const Client& client)
    {
        std::optional<std::optional<PropertyList>> reply;
        simulated.run(fontInfo.setupUserInstalledFontsFor(
            client.token, client.token, client.hasEnumeration, client.hasFontAccess, client.isFontProvider,
            client.identifier, [&](std::optional<PropertyList> dictionary) {
                EXPECT_FALSE(reply) << "answered twice";
                reply.emplace(std::move(dictionary));
            }));
        return reply;
    }
    PropertyList checkin(const Client& client) { return answer(client).value().value(); }
    PropertyList fontsFor(const Client& client) { return *checkin(client).find("fontsInfo"); }

    SimulatedPlatform simulated;
    UserFontUpdates updates{simulated.platform.processWideQueues};
    UserFontRegistry registry{simulated.fileSystem, simulated.log, updates};
    std::shared_ptr<WorkQueue> mainHandlerQueue = simulated.queues.createSerialQueue("com.vorlan.typhond");
    std::map<std::string, std::vector<std::string>> issued;
    PerClientFontInfo fontInfo{
        simulated.platform,
        registry,
        *mainHandlerQueue,
        {[this](const AuditToken& token) { return simulated.sandbox.isSandboxed(token); },
         [this](const std::string& identifier) { return issued[identifier]; }}};
    Dictionary fonts;
};

TEST_F(PerClientFontInfoTest, AClientWithoutCapabilitiesIsAnsweredWithNull)
{
    install(otherFont);
    const auto reply = answer({.token = sandboxed()});
    ASSERT_TRUE(reply);
    EXPECT_EQ(*reply, std::nullopt);
    EXPECT_TRUE(simulated.sandbox.issued().empty());
}

TEST_F(PerClientFontInfoTest, AnEmptyRegistryGivesAnEmptyFontsInfoToEverybody)
{
    const PropertyList empty = Dictionary{};
    EXPECT_EQ(fontsFor({.token = sandboxed(), .hasEnumeration = true}), empty);
    EXPECT_EQ(fontsFor({.token = sandboxed(), .hasFontAccess = true}), empty);
    EXPECT_EQ(fontsFor({.token = sandboxed(), .isFontProvider = true}), empty);
}

TEST_F(PerClientFontInfoTest, AnEnumeratingClientSeesAllEnabledFontsWithoutDataEvenInASandbox)
{
    install(ownFont);
    install(otherFont, fontWith("disabled", false));
    install(assetFile);
    EXPECT_EQ(fontsFor({.token = sandboxed(), .hasEnumeration = true}),
              PropertyList(Dictionary{{ownFont, font()}, {otherFont, font()}, {assetFile, font()}}));
}

TEST_F(PerClientFontInfoTest, ADisabledFontIsNeverListed)
{
    const auto disabled = fontWith("disabled", true);
    install(ownFont, disabled);
    issued["com.example.provider"] = {ownFont};
    const PropertyList nothing = Dictionary{};
    EXPECT_EQ(fontsFor({.token = unsandboxed(), .hasEnumeration = true}), nothing);
    EXPECT_EQ(fontsFor({.token = unsandboxed(), .isFontProvider = true}), nothing);
    EXPECT_EQ(fontsFor({.token = unsandboxed(), .hasFontAccess = true}), nothing);
}

TEST_F(PerClientFontInfoTest, KeysThatTheDaemonDoesNotKnowAreCarriedThrough)
{
    const auto entry = fontWith("installed by", "a user");
    install(ownFont, entry);
    EXPECT_EQ(fontsFor({.token = sandboxed(), .hasEnumeration = true}),
              PropertyList(Dictionary{{ownFont, entry}}));
}

TEST_F(PerClientFontInfoTest, AnEnumeratingClientGetsTheDirectoryExtensionsAndNothingHidden)
{
    const auto reply = checkin({.token = sandboxed(), .hasEnumeration = true, .isFontProvider = true});
    const auto grants = simulated.sandbox.issued();
    ASSERT_EQ(grants.size(), 2U);
    EXPECT_EQ(grants[0].path, "/var/mobile/Library/UserFonts/FontFiles");
    EXPECT_EQ(grants[1].path, fontAssets);
    EXPECT_EQ(reply, PropertyList(Dictionary{{"fontsInfo", Dictionary{}},
                                             {"extension", dataOf(grants[0].text)},
                                             {"extension.fontasset", dataOf(grants[1].text)}}));
}

TEST_F(PerClientFontInfoTest, TheEnumerationExtensionIsIssuedWhetherNeededOrNotTheAssetOneOnlyWhenNeeded)
{
    const auto token = sandboxed({"/var/mobile/Library/UserFonts/FontFiles", fontAssets});
    const auto reply = checkin({.token = token, .hasEnumeration = true});
    EXPECT_NE(reply.find("extension"), nullptr);
    EXPECT_EQ(reply.find("extension.fontasset"), nullptr);
}

TEST_F(PerClientFontInfoTest, ExtensionsThatAreNotIssuedAreLeftOut)
{
    const auto token = simulated.processes.add({.acceptsExtensions = false});
    EXPECT_EQ(checkin({.token = token, .hasEnumeration = true}),
              PropertyList(Dictionary{{"fontsInfo", Dictionary{}}}));
}

TEST_F(PerClientFontInfoTest, AllEnumeratingClientsShareOneFontsInfo)
{
    install(ownFont);
    const auto first = fontsFor({.token = sandboxed(), .hasEnumeration = true});
    const auto second = fontsFor({.token = unsandboxed(), .hasEnumeration = true, .hasFontAccess = true});
    EXPECT_EQ(first.identity().lock(), second.identity().lock());
}

TEST_F(PerClientFontInfoTest, AProviderSeesItsOwnFontsAndGetsItsDirectory)
{
    install(ownFont);
    install(otherFont);
    const auto reply = checkin({.token = sandboxed(), .isFontProvider = true});
    const auto grants = simulated.sandbox.issued();
    ASSERT_EQ(grants.size(), 1U);
    EXPECT_EQ(grants[0].path, fontFiles + "com.example.provider");
    EXPECT_EQ(reply, PropertyList(Dictionary{{"fontsInfo", Dictionary{{ownFont, font()}}},
                                             {"extension.provider", dataOf(grants[0].text)},
                                             {"hide-profilefonts", true}}));
}

TEST_F(PerClientFontInfoTest, AProviderThatCanReadItsDirectoryGetsNoExtension)
{
    install(ownFont);
    EXPECT_EQ(
        checkin({.token = unsandboxed(), .isFontProvider = true}),
        PropertyList(Dictionary{{"fontsInfo", Dictionary{{ownFont, font()}}}, {"hide-profilefonts", true}}));
}

TEST_F(PerClientFontInfoTest, AProviderWithoutFontsOfItsOwnGetsNoExtensionAndNoProfileFonts)
{
    install(otherFont);
    install(fontFiles + "com.example.provider/off.ttf", fontWith("disabled", true));
    EXPECT_EQ(checkin({.token = sandboxed(), .isFontProvider = true}),
              PropertyList(Dictionary{{"fontsInfo", Dictionary{}}, {"hide-profilefonts", true}}));
    EXPECT_TRUE(simulated.sandbox.issued().empty());
}

TEST_F(PerClientFontInfoTest, AProviderWithUserFontUseSeesProfileFonts)
{
    install(ownFont);
    const auto reply = checkin({.token = sandboxed(), .hasFontAccess = true, .isFontProvider = true});
    EXPECT_NE(reply.find("extension.provider"), nullptr);
    EXPECT_EQ(reply.find("hide-profilefonts"), nullptr);
}

TEST_F(PerClientFontInfoTest, AProviderWithoutIdentifierHasNoFontsOfItsOwn)
{
    install(ownFont);
    EXPECT_EQ(checkin({.token = sandboxed(), .isFontProvider = true, .identifier = std::nullopt}),
              PropertyList(Dictionary{{"fontsInfo", Dictionary{}}, {"hide-profilefonts", true}}));
}

TEST_F(PerClientFontInfoTest, AProvidersDirectoryIsFoundByItsNameAloneWhereverItLies)
{
    const auto elsewhere = fontAssets + "com.example.provider/b.ttf";
    install(elsewhere);
    install(fontFiles + "com.example.provider/deeper/c.ttf");
    EXPECT_EQ(fontsFor({.token = sandboxed(), .isFontProvider = true}),
              PropertyList(Dictionary{{elsewhere, font()}}));
}

TEST_F(PerClientFontInfoTest, IssuedFilesAreListedWithAGrantForEach)
{
    install(ownFont, fontWith("disabled", false));
    install(otherFont);
    issued["com.example.provider"] = {otherFont, fontFiles + "X/gone.ttf"};
    const auto reply = checkin({.token = sandboxed(), .hasFontAccess = true});
    const auto grants = simulated.sandbox.issued();
    ASSERT_EQ(grants.size(), 1U);
    EXPECT_EQ(grants[0].path, otherFont);
    EXPECT_EQ(reply, PropertyList(Dictionary{
                         {"fontsInfo", Dictionary{{otherFont, fontWith("data", dataOf(grants[0].text))}}}}));
}

TEST_F(PerClientFontInfoTest, WithoutIdentifierNothingCountsAsIssued)
{
    install(otherFont);
    issued[""] = {otherFont};
    EXPECT_EQ(fontsFor({.token = sandboxed(), .hasFontAccess = true, .identifier = std::nullopt}),
              PropertyList(Dictionary{}));
}

TEST_F(PerClientFontInfoTest, WithoutUserFontUseIssuedFilesAreNotListed)
{
    install(otherFont);
    issued["com.example.provider"] = {otherFont};
    EXPECT_EQ(fontsFor({.token = sandboxed(), .isFontProvider = true}), PropertyList(Dictionary{}));
}

TEST_F(PerClientFontInfoTest, AnIssuedFileThatASandboxedClientCanAlreadyReadIsLeftOut)
{
    install(ownFont);
    install(otherFont);
    issued["com.example.provider"] = {ownFont, otherFont};
    const auto listed = fontsFor({.token = sandboxed({otherFont}), .hasFontAccess = true});
    EXPECT_NE(listed.find(ownFont), nullptr);
    EXPECT_EQ(listed.find(otherFont), nullptr);
}

TEST_F(PerClientFontInfoTest, AnUnsandboxedClientsEntriesNeverCarryData)
{
    install(otherFont);
    issued["com.example.provider"] = {otherFont};
    EXPECT_EQ(fontsFor({.token = unsandboxed(), .hasFontAccess = true}),
              PropertyList(Dictionary{{otherFont, font()}}));
    EXPECT_TRUE(simulated.sandbox.issued().empty());
}

TEST_F(PerClientFontInfoTest, AFileInTheAssetStoreIsListedWithoutDataEvenToASandboxedClient)
{
    install(assetFile);
    issued["com.example.provider"] = {assetFile};
    EXPECT_EQ(fontsFor({.token = sandboxed({assetFile}), .hasFontAccess = true}),
              PropertyList(Dictionary{{assetFile, font()}}));
    EXPECT_TRUE(simulated.sandbox.issued().empty());
}

TEST_F(PerClientFontInfoTest, AnIssuedFileIsListedWithoutDataWhenNoGrantIsIssued)
{
    install(otherFont);
    issued["com.example.provider"] = {otherFont};
    const auto token = simulated.processes.add({.acceptsExtensions = false});
    EXPECT_EQ(fontsFor({.token = token, .hasFontAccess = true}),
              PropertyList(Dictionary{{otherFont, font()}}));
}

TEST_F(PerClientFontInfoTest, AProvidersOwnIssuedFileIsListedWithItsGrant)
{
    install(ownFont);
    install(otherFont);
    issued["com.example.provider"] = {ownFont};
    const auto listed = fontsFor({.token = sandboxed(), .hasFontAccess = true, .isFontProvider = true});
    EXPECT_EQ(listed.asDictionary()->size(), 1U);
    EXPECT_NE(listed.find(ownFont)->find("data"), nullptr);
}

TEST_F(PerClientFontInfoTest, AProvidersOwnIssuedFileThatItCanReadStaysListed)
{
    install(ownFont);
    issued["com.example.provider"] = {ownFont};
    EXPECT_EQ(fontsFor({.token = sandboxed({ownFont}), .hasFontAccess = true, .isFontProvider = true}),
              PropertyList(Dictionary{{ownFont, font()}}));
}

TEST_F(PerClientFontInfoTest, AnEnumeratingClientIsNotHelpedByIssuedPaths)
{
    install(otherFont);
    issued["com.example.provider"] = {otherFont};
    EXPECT_EQ(fontsFor({.token = sandboxed(), .hasEnumeration = true, .hasFontAccess = true}),
              PropertyList(Dictionary{{otherFont, font()}}));
}

TEST_F(PerClientFontInfoTest, AProcessThatIsGoneIsTakenForSandboxedAndGetsNoGrant)
{
    install(otherFont);
    issued["com.example.provider"] = {otherFont};
    const auto token = sandboxed();
    simulated.processes.exit(token);
    EXPECT_EQ(fontsFor({.token = token, .hasFontAccess = true}),
              PropertyList(Dictionary{{otherFont, font()}}));
    EXPECT_TRUE(simulated.sandbox.issued().empty());
}

TEST_F(PerClientFontInfoTest, TheGrantsGoToTheReceivingProcessNotToTheOneWhoseCapabilitiesApply)
{
    const auto receiver = sandboxed();
    const auto owner = sandboxed();
    simulated.run(fontInfo.setupUserInstalledFontsFor(receiver, owner, true, false, false, "com.example.web",
                                                      [](const std::optional<PropertyList>&) {}));
    const auto grants = simulated.sandbox.issued();
    ASSERT_EQ(grants.size(), 2U);
    EXPECT_EQ(grants[0].token, receiver);
    EXPECT_EQ(grants[1].token, receiver);
}

TEST_F(PerClientFontInfoTest, TheViewIsCutOnMainHandlerQueue)
{
    std::string label;
    simulated.run(fontInfo.setupUserInstalledFontsFor(
        sandboxed(), {}, true, false, false, "com.example.app",
        [&](const std::optional<PropertyList>&) { label = WorkItem::current()->queue.label(); }));
    EXPECT_EQ(label, "com.vorlan.typhond");
}

}  // namespace
}  // namespace typhon
