// What a pass deletes, keeps and forgets.

#include "deletion/deletion_fixture.h"

#include <cmath>

namespace typhon::test {
namespace {

const std::string folder = fontFiles + "com.example.provider";

class DeletionPass : public DeletionTest {
protected:
    /// Runs a pass with that schedule.
    void pass(Dictionary entries)
    {
        setSchedule(std::move(entries));
        pass();
    }
    void pass()
    {
        deletion->stopFontFilesDeletionTimer();
        deletion->setFontFilesDeletionTimer(0);
        simulated.drain();
    }
    void passOver(const std::vector<std::string>& duePaths)
    {
        Dictionary entries;
        for (const auto& path : duePaths) {
            entries.emplace(path, dueIn(0));
        }
        pass(std::move(entries));
    }
    bool hasFailed(const std::string& path) const
    {
        return simulated.log.countContaining("scheduled deletion failed: \"" + path + "\" - ") == 1;
    }
};

TEST_F(DeletionPass, AnEmptyScheduleIsAnErrorAndStopsTheTimer)
{
    pass(Dictionary{});
    EXPECT_TRUE(hasLogged(LogLevel::error, "executeScheduledFontFilesDeletion - no files to delete."));
    EXPECT_EQ(simulated.preferences.writes(), 0U);
    // A timer that was stopped lets the next batch arm a new one.
    setDelay(4);
    schedule({file(folder + "/a.ttf")});
    advance(6);
    EXPECT_FALSE(exists(folder + "/a.ttf"));
}

TEST_F(DeletionPass, AnEntryDueInLessThanThreeMinutesGoesNow)
{
    pass(Dictionary{{file(folder + "/a.ttf"), dueIn(179)},
                    {file(folder + "/b.ttf"), dueIn(180)},
                    {file(folder + "/c.ttf"), dueIn(179.999)},
                    {file(folder + "/d.ttf"), dueIn(-1e9)}});
    EXPECT_FALSE(exists(folder + "/a.ttf"));
    EXPECT_TRUE(exists(folder + "/b.ttf"));
    EXPECT_FALSE(exists(folder + "/c.ttf"));
    EXPECT_FALSE(exists(folder + "/d.ttf"));
    EXPECT_EQ(scheduled().size(), 1U);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "scheduled deletion: 3"));
    EXPECT_TRUE(hasLogged(LogLevel::debug, "next deletion after 180 seconds."));
}

TEST_F(DeletionPass, TheEarliestOfTheOthersIsToldInWholeSeconds)
{
    pass(Dictionary{
        {folder + "/a", dueIn(900.9)}, {folder + "/b", dueIn(700.6)}, {folder + "/c", dueIn(800)}});
    EXPECT_TRUE(hasLogged(LogLevel::debug, "next deletion after 700 seconds."));
    EXPECT_EQ(simulated.log.countContaining("scheduled deletion"), 0U);
    EXPECT_EQ(simulated.preferences.writes(), 0U) << "nothing has changed";
}

TEST_F(DeletionPass, WhatIsFurtherAwayThanCanBeToldCountsAsNothing)
{
    pass(Dictionary{{folder + "/a", dueIn(4294967295.0)}, {folder + "/b", Date{std::nan("")}}});
    EXPECT_TRUE(hasLogged(LogLevel::debug, "all files deleted."));
    EXPECT_EQ(scheduled().size(), 2U);
    pass(Dictionary{{folder + "/a", dueIn(4294967294.5)}});
    EXPECT_TRUE(hasLogged(LogLevel::debug, "next deletion after 4294967294 seconds."));
}

TEST_F(DeletionPass, AnEntryWithoutADateIsDroppedAndItsFileStays)
{
    pass(Dictionary{{file(folder + "/a.ttf"), "now"}, {file(folder + "/b.ttf"), 0}});
    EXPECT_TRUE(exists(folder + "/a.ttf"));
    EXPECT_TRUE(exists(folder + "/b.ttf"));
    EXPECT_TRUE(scheduled().empty());
    EXPECT_EQ(simulated.preferences.synchronizes(), 1U);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "all files deleted."));
    EXPECT_EQ(simulated.log.countContaining("scheduled deletion"), 0U);
}

TEST_F(DeletionPass, AnEntryOutsideTheTreesIsDroppedAndItsFileStays)
{
    passOver({file("/etc/passwd"), file("/var/mobile/Library/UserFonts/UserFonts.plist"),
              file(assetStore + "a/AssetData/a.ttf")});
    EXPECT_TRUE(exists("/etc/passwd"));
    EXPECT_TRUE(exists("/var/mobile/Library/UserFonts/UserFonts.plist"));
    EXPECT_TRUE(exists(assetStore + "a/AssetData/a.ttf"));
    EXPECT_TRUE(scheduled().empty());
}

TEST_F(DeletionPass, EntriesAreForgottenBeforeTheFilesGo)
{
    simulated.preferences.setFailing(true);
    passOver({file(folder + "/a.ttf")});
    EXPECT_FALSE(exists(folder + "/a.ttf"));
    EXPECT_EQ(scheduled().size(), 1U) << "the disk has not taken it; a restart tries again";
    simulated.preferences.setFailing(false);
    restart();
    EXPECT_TRUE(hasFailed(folder + "/a.ttf"));
    EXPECT_TRUE(scheduled().empty());
}

TEST_F(DeletionPass, AMissingFileFailsAndItsEntryIsGoneAllTheSame)
{
    passOver({folder + "/absent.ttf"});
    EXPECT_TRUE(hasLogged(LogLevel::error, "scheduled deletion failed: \"" + folder +
                                               "/absent.ttf\" - No such file or directory"));
    EXPECT_TRUE(scheduled().empty());
}

TEST_F(DeletionPass, AFailureIsLoggedAndTheOthersGo)
{
    simulated.fileSystem.setUndeletable(folder + "/a.ttf");
    passOver({file(folder + "/a.ttf"), file(folder + "/b.ttf")});
    EXPECT_TRUE(hasFailed(folder + "/a.ttf"));
    EXPECT_TRUE(exists(folder + "/a.ttf"));
    EXPECT_FALSE(exists(folder + "/b.ttf"));
    EXPECT_TRUE(scheduled().empty());
    restart();
    EXPECT_TRUE(exists(folder + "/a.ttf")) << "not tried again";
}

TEST_F(DeletionPass, AFolderGoesWithItsContents)
{
    file(folder + "/family/a.ttf");
    file(folder + "/family/b/c.ttf");
    file(folder + "/other.ttf");
    passOver({folder + "/family"});
    EXPECT_FALSE(exists(folder + "/family"));
    EXPECT_TRUE(exists(folder + "/other.ttf"));
}

TEST_F(DeletionPass, AFolderLeftEmptyGoesTooAndOneWithMoreInItStays)
{
    file(fontFiles + "com.example.other/b.ttf");
    passOver({file(folder + "/a.ttf"), file(fontFiles + "com.example.other/a.ttf")});
    EXPECT_FALSE(exists(folder));
    EXPECT_TRUE(exists(fontFiles + "com.example.other/b.ttf"));
}

TEST_F(DeletionPass, AFolderGoesAfterTheOneInIt)
{
    passOver({file(folder + "/a.ttf"), file(folder + "/family/a.ttf")});
    EXPECT_FALSE(exists(folder));
}

TEST_F(DeletionPass, TheFolderOfAFileThatFailedGoesIfItIsEmpty)
{
    simulated.fileSystem.addDirectory(folder);
    passOver({folder + "/absent.ttf"});
    EXPECT_FALSE(exists(folder));
}

TEST_F(DeletionPass, TheTreeItselfGoesWhenAFileDirectlyInItLeavesItEmpty)
{
    file(fontAssets + "abc.asset/a.ttf");
    passOver({file(fontFiles + "a.ttf")});
    EXPECT_FALSE(exists(fontFiles));
    EXPECT_TRUE(exists(fontAssets));
}

TEST_F(DeletionPass, TheTreeItselfStaysWhileSomethingElseIsInIt)
{
    file(folder + "/b.ttf");
    passOver({file(fontFiles + "a.ttf")});
    EXPECT_FALSE(exists(fontFiles + "a.ttf"));
    EXPECT_TRUE(exists(folder + "/b.ttf"));
}

TEST_F(DeletionPass, AnAssetsFileIsKeptForGoodWhileTheStoreHoldsTheAsset)
{
    file(assetStore + "abc.asset/AssetData/a.ttf");
    passOver({file(fontAssets + "abc.asset/a.ttf"), file(fontAssets + "xyz.asset/a.ttf")});
    EXPECT_TRUE(exists(fontAssets + "abc.asset/a.ttf"));
    EXPECT_FALSE(exists(fontAssets + "xyz.asset"));
    EXPECT_TRUE(scheduled().empty());
    EXPECT_TRUE(hasLogged(LogLevel::debug, "scheduled deletion: 2"));
    EXPECT_EQ(simulated.log.countContaining("failed"), 0U);
    simulated.fileSystem.remove(assetStore + "abc.asset");
    restart();
    EXPECT_TRUE(exists(fontAssets + "abc.asset/a.ttf"));
}

TEST_F(DeletionPass, TheStoreIsAskedByTheNameOfTheHoldingFolder)
{
    file(assetStore + "inner/AssetData/a.ttf");
    passOver({file(fontAssets + "abc.asset/inner/a.ttf"), file(fontAssets + "inner/deep/a.ttf")});
    EXPECT_TRUE(exists(fontAssets + "abc.asset/inner/a.ttf"));
    EXPECT_FALSE(exists(fontAssets + "inner/deep/a.ttf"));
    // Font files are none of the store's.
    passOver({file(fontFiles + "inner/a.ttf")});
    EXPECT_FALSE(exists(fontFiles + "inner/a.ttf"));
}

TEST_F(DeletionPass, HostilePathsFailAndHarmNothing)
{
    file("/var/mobile/Library/UserFonts/UserFonts.plist");
    file("/etc/passwd");
    file(folder + "/a.ttf");
    const std::vector<std::string> hostile{
        fontFiles + "../UserFonts.plist",
        fontFiles + "com.example.provider/../com.example.provider/a.ttf",
        fontFiles + "..",
        fontFiles,
        fontFiles + "/.",
        folder + std::string("/a.ttf\0", 7),
        fontFiles + std::string(100'000, 'x'),
        fontAssets,
        fontFiles + "../../../../../etc/passwd",
    };
    passOver(hostile);
    for (const auto& path : hostile) {
        EXPECT_TRUE(hasFailed(path)) << path.substr(0, 200);
    }
    EXPECT_TRUE(exists("/var/mobile/Library/UserFonts/UserFonts.plist"));
    EXPECT_TRUE(exists("/etc/passwd"));
    EXPECT_TRUE(exists(folder + "/a.ttf"));
    EXPECT_TRUE(scheduled().empty());
}

TEST_F(DeletionPass, AFileIsNotTakenForAFolderLeftEmpty)
{
    file(folder + "/a.ttf");
    passOver({folder + "/a.ttf/below"});
    EXPECT_TRUE(exists(folder + "/a.ttf"));
}

TEST_F(DeletionPass, AHundredThousandWaitingEntriesAreWalkedWithoutAWrite)
{
    Dictionary entries;
    for (int i = 0; i < 100'000; ++i) {
        entries.emplace(folder + "/" + std::to_string(i) + ".ttf", dueIn(1000 + i));
    }
    pass(std::move(entries));
    EXPECT_EQ(simulated.preferences.writes(), 0U);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "next deletion after 1000 seconds."));
}

}  // namespace
}  // namespace typhon::test
