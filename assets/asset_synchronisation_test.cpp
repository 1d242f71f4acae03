#include "assets/asset_fixture.h"
#include "assets/asset_synchronisation.h"

#include <optional>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;
using Strings = std::vector<std::string>;

class AssetSynchronisationTest : public AssetTest {
protected:
    struct Answer {
        bool success = false;
        std::optional<PropertyList> dictionary;
    };

    void ask(const AuditToken& token, Strings paths)
    {
        simulated.runAs(token,
                        synchronisation.synchronizeFontAssets(
                            std::move(paths), [this](bool success, std::optional<PropertyList> answer) {
                                answers.push_back({success, std::move(answer)});
                            }));
    }
    AuditToken clientWith(PropertyList entitlement)
    {
        return simulated.processes.add(
            {.signingIdentifier = "com.example.reader",
             .entitlements = {{"com.vorlan.developer.user-fonts", std::move(entitlement)}}});
    }
    AuditToken client() { return clientWith(Array{"app-usage"}); }
    /// The paths in the last answer.
    Strings paths() const
    {
        Strings found;
        if (!answers.empty() && answers.back().dictionary) {
            for (const auto& [path, entry] : *answers.back().dictionary->find("fontsInfo")->asDictionary()) {
                found.push_back(path);
            }
        }
        return found;
    }
    static std::string inStore(const std::string& asset, const std::string& file = "font.ttf")
    {
        return storeOfFonts + asset + "/AssetData/" + file;
    }
    bool hasComplainedOf(const std::string& path) const
    {
        return hasLogged(LogLevel::error, "synchronizeFontAssets got a non-asset font file path: " + path);
    }

    std::shared_ptr<WorkQueue> mainHandlerQueue = simulated.queues.createSerialQueue("com.vorlan.typhond");
    PerClientFontInfo perClientFontInfo{
        simulated.platform,
        registry,
        *mainHandlerQueue,
        {[this](const AuditToken& token) { return simulated.sandbox.isSandboxed(token); },
         [](const std::string&) { return Strings{}; }}};
    AssetSynchronisation synchronisation{simulated.platform, perClientFontInfo, *mainHandlerQueue};
    std::vector<Answer> answers;
};

TEST_F(AssetSynchronisationTest, AnEmptyCollectionYieldsNoFontsAndNoSynchronisation)
{
    ask(client(), {});
    ASSERT_EQ(answers.size(), 1U);
    EXPECT_TRUE(answers[0].success);
    EXPECT_EQ(*answers[0].dictionary->find("fontsInfo"), PropertyList(Dictionary{}));
    ASSERT_NE(answers[0].dictionary->find("extension.fontasset"), nullptr);
    EXPECT_NE(answers[0].dictionary->find("extension.fontasset")->asData(), nullptr);
    EXPECT_EQ(synchronisations(), 0U);
}

TEST_F(AssetSynchronisationTest, AMissingExtensionLeavesOutItsKeyOnly)
{
    const auto unconfined = simulated.processes.add(
        {.entitlements = {{"com.vorlan.developer.user-fonts", Array{"font-enumeration"}}},
         .acceptsExtensions = false});
    ask(unconfined, {});
    ASSERT_EQ(answers.size(), 1U);
    EXPECT_TRUE(answers[0].success);
    EXPECT_EQ(answers[0].dictionary, PropertyList(Dictionary{{"fontsInfo", Dictionary{}}}));
}

TEST_F(AssetSynchronisationTest, TwoFilesOfAnAssetCountOnce)
{
    register_({{fontAssets + "abc.asset/a.ttf", fontEntry("A")}});
    ask(client(), {inStore("abc.asset", "a.ttf"), inStore("abc.asset", "b.ttf")});
    EXPECT_EQ(paths(), Strings{fontAssets + "abc.asset/a.ttf"});
    EXPECT_EQ(synchronisations(), 0U);
}

TEST_F(AssetSynchronisationTest, ThoseWhoAskTheSameGetTheVeryValueUntilTheRegistryChanges)
{
    const auto reader = client();
    register_(
        {{fontAssets + "abc.asset/a.ttf", fontEntry("A")}, {fontAssets + "d.asset/d.ttf", fontEntry("D")}});
    const auto answered = [&](Strings paths) {
        ask(reader, std::move(paths));
        return *answers.back().dictionary->find("fontsInfo");
    };
    const auto first = answered({inStore("abc.asset")});
    EXPECT_EQ(answered({inStore("abc.asset", "other.ttf")}).asDictionary(), first.asDictionary());
    answered({inStore("d.asset")});
    EXPECT_EQ(paths(), Strings{fontAssets + "d.asset/d.ttf"});
    register_({{fontAssets + "d.asset/e.ttf", fontEntry("E")}});
    answered({inStore("d.asset")});
    EXPECT_EQ(paths(), Strings{fontAssets + "d.asset/e.ttf"});
}

TEST_F(AssetSynchronisationTest, EntriesAreCopiedUnchanged)
{
    const PropertyList entry = Dictionary{{"familyName", Dictionary{{"A", "A"}}}, {"disabled", true}};
    register_({{fontAssets + "abc.asset/a.ttf", entry}});
    ask(client(), {inStore("abc.asset")});
    EXPECT_EQ(*answers.at(0).dictionary->find("fontsInfo"),
              PropertyList(Dictionary{{fontAssets + "abc.asset/a.ttf", entry}}));
}

TEST_F(AssetSynchronisationTest, AnAssetThatIsNotRegisteredIsSynchronisedFirst)
{
    simulated.userFontManager.setFontAssets({{fontAssets + "abc.asset/a.ttf", fontEntry("A")},
                                             {fontAssets + "other.asset/o.ttf", fontEntry("O")}});
    ask(client(), {inStore("abc.asset")});
    EXPECT_EQ(synchronisations(), 1U);
    EXPECT_EQ(paths(), Strings{fontAssets + "abc.asset/a.ttf"});
}

TEST_F(AssetSynchronisationTest, AnAssetWithSeveralFontsStandsForOneThatIsMissing)
{
    register_(
        {{fontAssets + "abc.asset/a.ttf", fontEntry("A")}, {fontAssets + "abc.asset/b.ttf", fontEntry("B")}});
    ask(client(), {inStore("abc.asset"), inStore("missing.asset")});
    EXPECT_EQ(synchronisations(), 0U) << "two entries for two names";
    EXPECT_EQ(paths().size(), 2U);
}

TEST_F(AssetSynchronisationTest, AFailedSynchronisationStillAnswersWithWhatIsThere)
{
    register_({{fontAssets + "abc.asset/a.ttf", fontEntry("A")}});
    simulated.userFontManager.failNext("the disk is full");
    ask(client(), {inStore("abc.asset"), inStore("missing.asset")});
    ASSERT_EQ(answers.size(), 1U);
    EXPECT_TRUE(answers[0].success);
    EXPECT_EQ(paths(), Strings{fontAssets + "abc.asset/a.ttf"});
}

TEST_F(AssetSynchronisationTest, WaitsForTheLibraryWithoutHoldingTheMainHandlerQueue)
{
    simulated.userFontManager.holdOperations();
    simulated.userFontManager.setFontAssets({{fontAssets + "abc.asset/a.ttf", fontEntry("A")}});
    const auto queue = simulated.queues.createSerialQueue("client");
    const auto token = client();
    const auto [accepted, other] = simulated.connect(token);
    bool isAnswered = false;
    queue->asyncForConnection(
        accepted, synchronisation.synchronizeFontAssets(
                      {inStore("abc.asset")},
                      [&](bool success, const std::optional<PropertyList>&) { isAnswered = success; }));
    simulated.drain();
    EXPECT_FALSE(isAnswered);
    bool hasRun = false;
    mainHandlerQueue->async([&] { hasRun = true; });
    simulated.drain();
    EXPECT_TRUE(hasRun);
    EXPECT_FALSE(isAnswered);
    ASSERT_TRUE(simulated.userFontManager.finishNext());
    simulated.drain();
    EXPECT_TRUE(isAnswered);
}

TEST_F(AssetSynchronisationTest, AFileOutsideAssetDataIsLoggedWithItsDirectory)
{
    ask(client(), {storeOfFonts + "abc.asset/Other/font.ttf"});
    EXPECT_TRUE(hasComplainedOf(storeOfFonts + "abc.asset/Other"));
    EXPECT_EQ(synchronisations(), 0U);
    EXPECT_TRUE(answers.at(0).success);
}

TEST_F(AssetSynchronisationTest, APathOutsideTheStoreIsLoggedAndSkipped)
{
    const auto path = fontAssets + "abc.asset/AssetData/font.ttf";
    register_({{fontAssets + "def.asset/d.ttf", fontEntry("D")}});
    ask(client(), {path, "relative", "", inStore("def.asset")});
    EXPECT_TRUE(hasComplainedOf(path));
    EXPECT_TRUE(hasComplainedOf("relative"));
    EXPECT_TRUE(hasComplainedOf(""));
    EXPECT_EQ(synchronisations(), 0U);
    EXPECT_EQ(paths(), Strings{fontAssets + "def.asset/d.ttf"});
}

TEST_F(AssetSynchronisationTest, ClientsWithoutTheEntitlementAreRefusedInSilence)
{
    for (const PropertyList& entitlement :
         {PropertyList("font-enumeration"), PropertyList(Array{"system-installation"}), PropertyList(Array{}),
          PropertyList(Dictionary{{"app-usage", true}}), PropertyList(true)}) {
        ask(clientWith(entitlement), {inStore("abc.asset"), "relative"});
    }
    ask(AuditToken{}, {inStore("abc.asset")});
    ask(simulated.processes.add({}), {inStore("abc.asset")});
    ASSERT_EQ(answers.size(), 7U);
    for (const auto& answer : answers) {
        EXPECT_FALSE(answer.success);
        EXPECT_EQ(answer.dictionary, std::nullopt);
    }
    EXPECT_TRUE(simulated.log.entries().empty());
    EXPECT_EQ(synchronisations(), 0U);
}

TEST_F(AssetSynchronisationTest, EitherEntitlementIsEnough)
{
    ask(clientWith(Array{"font-enumeration"}), {});
    ask(clientWith(Array{1, "app-usage"}), {});
    EXPECT_TRUE(answers.at(0).success);
    EXPECT_TRUE(answers.at(1).success);
}

TEST_F(AssetSynchronisationTest, FontsElsewhereAreNeverReturned)
{
    register_({{"/var/mobile/Library/UserFonts/FontFiles/abc.asset/a.ttf", fontEntry("A")},
               {fontAssets + "abc.asset/deeper/b.ttf", fontEntry("B")},
               {fontAssets + "other.asset/c.ttf", fontEntry("C")}});
    ask(client(), {inStore("abc.asset")});
    EXPECT_EQ(paths(), Strings{});
}

}  // namespace
}  // namespace typhon
