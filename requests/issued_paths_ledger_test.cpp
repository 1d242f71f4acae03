#include "platform/simulated/simulated_platform.h"
#include "requests/issued_paths_ledger.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;
using Paths = std::vector<std::string>;

const std::string userFont = "/var/mobile/Library/UserFonts/FontFiles/X/a.ttf";
const std::string secondUserFont = "/var/mobile/Library/UserFonts/FontFiles/X/b.ttf";
const std::string assetFont = "/var/mobile/Library/UserFonts/FontAssets/abc.asset/a.ttf";
const std::string storeFont =
    "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/abc.asset/AssetData/a.ttf";
const std::string app = "com.example.app";
const std::string entitlement = "com.vorlan.Typhon.allow-reset-issued-fonts";

class IssuedPathsLedgerTest : public testing::Test {
protected:
    IssuedPathsLedgerTest() { setInstalled({userFont, secondUserFont, assetFont, storeFont}); }

    void setInstalled(const Paths& paths)
    {
        Dictionary fonts;
        for (const auto& path : paths) {
            fonts.emplace(path, Dictionary{});
        }
        registry.setUserFontsInfo(std::move(fonts));
    }
    /// Puts something into the store, as if from an earlier time.
    void setIssues(PropertyList issues)
    {
        simulated.preferences.changeFromOutside("issues", std::move(issues));
    }
    PropertyList issues()
    {
        return simulated.preferences.durableValue("issues").value_or(PropertyList("none"));
    }
    PropertyList recordOf(const std::string& identifier)
    {
        const auto stored = issues();
        const auto* record = stored.find(identifier);
        return record == nullptr ? PropertyList("none") : *record;
    }

    /// Has a process with that entitlement value reset the record of `app`; returns the number of replies.
    int resetBy(std::optional<PropertyList> entitlementValue)
    {
        Dictionary entitlements;
        if (entitlementValue) {
            entitlements.emplace(entitlement, *entitlementValue);
        }
        const auto token = simulated.processes.add({.entitlements = entitlements});
        int replies = 0;
        simulated.runAs(token, ledger.resetIssuedFontsFor(app, [&] { ++replies; }));
        return replies;
    }

    SimulatedPlatform simulated;
    UserFontUpdates updates{simulated.platform.processWideQueues};
    UserFontRegistry registry{simulated.fileSystem, simulated.log, updates};
    IssuedPathsLedger ledger{simulated.preferences, simulated.codeSigning, registry};
};

TEST_F(IssuedPathsLedgerTest, AUserFontIsStoredShortenedAndReadBackAbsolute)
{
    ledger.recordIssuedFontPaths({userFont}, app);
    EXPECT_EQ(issues(), PropertyList(Dictionary{{app, PropertyList::Array{"U/X/a.ttf"}}}));
    EXPECT_EQ(ledger.issuedFontFilePathsForIdentifier(app), Paths{userFont});
}

TEST_F(IssuedPathsLedgerTest, AnAssetFontIsStoredShortenedAndOthersAsTheyAre)
{
    ledger.recordIssuedFontPaths({assetFont, storeFont}, app);
    EXPECT_EQ(recordOf(app), (PropertyList::Array{storeFont, "A/abc.asset/a.ttf"}));
    EXPECT_EQ(ledger.issuedFontFilePathsForIdentifier(app), (Paths{storeFont, assetFont}));
}

TEST_F(IssuedPathsLedgerTest, APathOutsideTheRegistryIsNotRecorded)
{
    ledger.recordIssuedFontPaths({"/var/mobile/Library/UserFonts/FontFiles/X/c.ttf", userFont}, app);
    EXPECT_EQ(recordOf(app), PropertyList::Array{"U/X/a.ttf"});
}

TEST_F(IssuedPathsLedgerTest, SanitisingDropsUnknownPathsAndDuplicates)
{
    EXPECT_EQ(ledger.sanitizeIssuedFontPaths({userFont, "/gone.ttf", assetFont, userFont}),
              (Paths{"A/abc.asset/a.ttf", "U/X/a.ttf"}));
    registry.setUserFontsInfo(Dictionary{});
    EXPECT_EQ(ledger.sanitizeIssuedFontPaths({userFont}), Paths{});
}

TEST_F(IssuedPathsLedgerTest, PathsJustOutsideADirectoryAreNotShortened)
{
    const std::string similar = "/var/mobile/Library/UserFonts/FontFilesX/a.ttf";
    setInstalled({similar});
    EXPECT_EQ(ledger.sanitizeIssuedFontPaths({similar}), Paths{similar});
}

TEST_F(IssuedPathsLedgerTest, RecordingTheSamePathsTwiceWritesOnce)
{
    ledger.recordIssuedFontPaths({userFont, assetFont}, app);
    EXPECT_EQ(simulated.preferences.writes(), 1U);
    EXPECT_EQ(simulated.preferences.synchronizes(), 1U);
    ledger.recordIssuedFontPaths({assetFont, userFont}, app);
    ledger.recordIssuedFontPaths({}, app);
    EXPECT_EQ(simulated.preferences.writes(), 1U);
    EXPECT_EQ(simulated.preferences.synchronizes(), 1U);
}

TEST_F(IssuedPathsLedgerTest, AStoredRecordInAnotherOrderIsTheSame)
{
    setIssues(Dictionary{{app, PropertyList::Array{"U/X/b.ttf", "U/X/a.ttf", "U/X/b.ttf"}}});
    ledger.recordIssuedFontPaths({userFont}, app);
    EXPECT_EQ(simulated.preferences.writes(), 0U);
}

TEST_F(IssuedPathsLedgerTest, NewPathsAreMergedWithOldOnes)
{
    ledger.recordIssuedFontPaths({userFont}, app);
    ledger.recordIssuedFontPaths({secondUserFont}, app);
    EXPECT_EQ(recordOf(app), (PropertyList::Array{"U/X/a.ttf", "U/X/b.ttf"}));
}

TEST_F(IssuedPathsLedgerTest, AnUninstalledFileIsDroppedByTheNextRecord)
{
    ledger.recordIssuedFontPaths({userFont}, app);
    setInstalled({secondUserFont});
    EXPECT_EQ(ledger.issuedFontFilePathsForIdentifier(app), Paths{userFont});
    ledger.recordIssuedFontPaths({secondUserFont}, app);
    EXPECT_EQ(recordOf(app), PropertyList::Array{"U/X/b.ttf"});
}

TEST_F(IssuedPathsLedgerTest, AMissingRegistryPrunesEverything)
{
    ledger.recordIssuedFontPaths({userFont}, app);
    registry.setUserFontsInfo(Dictionary{});
    ledger.recordIssuedFontPaths({userFont}, app);
    EXPECT_EQ(recordOf(app), PropertyList::Array{});
}

TEST_F(IssuedPathsLedgerTest, AFirstRecordIsWrittenEvenWhenItIsEmpty)
{
    ledger.recordIssuedFontPaths({"/gone.ttf"}, app);
    EXPECT_EQ(recordOf(app), PropertyList::Array{});
    EXPECT_EQ(simulated.preferences.writes(), 1U);
}

TEST_F(IssuedPathsLedgerTest, WithoutIdentifierNothingIsRecordedOrForgotten)
{
    ledger.recordIssuedFontPaths({userFont}, std::nullopt);
    ledger.forgetClientApplication(std::nullopt);
    EXPECT_EQ(simulated.preferences.writes(), 0U);
}

TEST_F(IssuedPathsLedgerTest, OtherApplicationsRecordsAreLeftAlone)
{
    setIssues(Dictionary{{"com.example.other", PropertyList::Array{"U/gone.ttf"}}});
    ledger.recordIssuedFontPaths({userFont}, app);
    ledger.forgetClientApplication(app);
    EXPECT_EQ(issues(), PropertyList(Dictionary{{"com.example.other", PropertyList::Array{"U/gone.ttf"}}}));
}

TEST_F(IssuedPathsLedgerTest, AnUnreadableRecordReadsAsNoneAndIsReplaced)
{
    setIssues("not a dictionary");
    EXPECT_EQ(ledger.issuedFontFilePathsForIdentifier(app), Paths{});
    setIssues(Dictionary{{app, "not an array"}});
    EXPECT_EQ(ledger.issuedFontFilePathsForIdentifier(app), Paths{});
    ledger.recordIssuedFontPaths({userFont}, app);
    EXPECT_EQ(recordOf(app), PropertyList::Array{"U/X/a.ttf"});
}

TEST_F(IssuedPathsLedgerTest, ForgettingDropsTheRecordAndForgettingAnUnknownOneWritesNothing)
{
    ledger.recordIssuedFontPaths({userFont}, app);
    ledger.forgetClientApplication(app);
    EXPECT_EQ(recordOf(app), PropertyList("none"));
    EXPECT_EQ(simulated.preferences.synchronizes(), 2U);
    ledger.forgetClientApplication(app);
    EXPECT_EQ(simulated.preferences.writes(), 2U);
}

TEST_F(IssuedPathsLedgerTest, AnEntitledCallerResetsTheRecordAndIsAnswered)
{
    ledger.recordIssuedFontPaths({userFont}, app);
    EXPECT_EQ(resetBy(true), 1);
    EXPECT_EQ(recordOf(app), PropertyList("none"));
    EXPECT_FALSE(simulated.preferences.hasUnsynchronizedChanges());
    EXPECT_EQ(resetBy(true), 1);
    EXPECT_EQ(simulated.preferences.writes(), 2U);
}

TEST_F(IssuedPathsLedgerTest, OnlyTheBooleanTrueEntitlesAndEverybodyIsAnswered)
{
    ledger.recordIssuedFontPaths({userFont}, app);
    EXPECT_EQ(resetBy("true"), 1);
    EXPECT_EQ(resetBy(1), 1);
    EXPECT_EQ(resetBy(false), 1);
    EXPECT_EQ(resetBy(PropertyList::Array{true}), 1);
    EXPECT_EQ(resetBy(std::nullopt), 1);
    EXPECT_EQ(recordOf(app), PropertyList::Array{"U/X/a.ttf"});
    EXPECT_TRUE(simulated.log.entries().empty());
}

TEST_F(IssuedPathsLedgerTest, WithoutACurrentConnectionNobodyIsEntitledButAnswered)
{
    ledger.recordIssuedFontPaths({userFont}, app);
    int replies = 0;
    simulated.run(ledger.resetIssuedFontsFor(app, [&] { ++replies; }));
    EXPECT_EQ(replies, 1);
    EXPECT_EQ(recordOf(app), PropertyList::Array{"U/X/a.ttf"});
}

}  // namespace
}  // namespace typhon
