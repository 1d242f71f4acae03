#include "assets/asset_directory_monitoring.h"
#include "assets/asset_fixture.h"

#include <chrono>

namespace typhon {
namespace {

using namespace std::chrono_literals;

class AssetDirectoryMonitoringTest : public AssetTest {
protected:
    void setUp()
    {
        monitoring->setupForMonitoringFontAssets();
        simulated.drain();
    }
    void advance(std::chrono::nanoseconds time)
    {
        simulated.scheduler.advance(time);
        simulated.drain();
    }

    std::shared_ptr<AssetDirectoryMonitoring> monitoring =
        std::make_shared<AssetDirectoryMonitoring>(simulated.platform);
};

TEST_F(AssetDirectoryMonitoringTest, WatchesOnlyAfterTheFirstSynchronisation)
{
    simulated.userFontManager.holdOperations();
    setUp();
    EXPECT_EQ(synchronisations(), 1U);
    EXPECT_EQ(simulated.fileEvents.startedStreams(), 0U);
    simulated.userFontManager.finishNext();
    simulated.drain();
    EXPECT_EQ(simulated.fileEvents.startedStreams(), 1U);
    EXPECT_EQ(synchronisations(), 1U);
}

TEST_F(AssetDirectoryMonitoringTest, AFailingFirstSynchronisationStillStartsTheWatch)
{
    simulated.userFontManager.failNext("the disk is full");
    setUp();
    EXPECT_EQ(simulated.fileEvents.startedStreams(), 1U);
}

TEST_F(AssetDirectoryMonitoringTest, ABurstWithinThreeSecondsIsOneSynchronisation)
{
    setUp();
    simulated.fileEvents.change(storeOfFonts + "b.asset/AssetData/b.ttf");
    advance(2s);
    simulated.fileEvents.change(storeOfFonts + "a.asset/AssetData/a.ttf");
    advance(999ms);
    EXPECT_EQ(synchronisations(), 1U);
    advance(1ms);
    EXPECT_EQ(synchronisations(), 2U);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "FontAssetsEventStreamCallback - (\"" + storeOfFonts +
                                               "a.asset/AssetData/a.ttf\", \"" + storeOfFonts +
                                               "b.asset/AssetData/b.ttf\")"));
    EXPECT_TRUE(hasLogged(LogLevel::debug, "synchronizeFontAssets result - success"));
    advance(10s);
    EXPECT_EQ(synchronisations(), 2U);
}

TEST_F(AssetDirectoryMonitoringTest, AFailedSynchronisationIsLoggedAndTheNextBatchTriesAgain)
{
    setUp();
    simulated.userFontManager.failNext("the disk is full");
    simulated.fileEvents.change(storeOfFonts + "a.asset/AssetData/a.ttf");
    advance(3s);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "synchronizeFontAssets result - fail"));
    simulated.fileEvents.change(storeOfFonts + "a.asset/AssetData/a.ttf");
    advance(3s);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "synchronizeFontAssets result - success"));
    EXPECT_EQ(synchronisations(), 3U);
}

TEST_F(AssetDirectoryMonitoringTest, BatchesDoNotWaitForASynchronisationToEnd)
{
    setUp();
    simulated.userFontManager.holdOperations();
    for (int batch = 0; batch < 3; ++batch) {
        simulated.fileEvents.change(storeOfFonts + "a.asset/AssetData/a.ttf");
        advance(3s);
    }
    EXPECT_EQ(synchronisations(), 4U);
}

TEST_F(AssetDirectoryMonitoringTest, ChangesOfTheFontAssetDirectoryTriggerNothing)
{
    setUp();
    simulated.fileEvents.change(fontAssets + "a.asset/a.ttf");
    advance(10s);
    EXPECT_EQ(synchronisations(), 1U);
}

TEST_F(AssetDirectoryMonitoringTest, ALongListOfPathsIsCutInTheLog)
{
    setUp();
    for (int file = 0; file < 1000; ++file) {
        simulated.fileEvents.change(storeOfFonts + "a.asset/AssetData/" + std::to_string(file) + ".ttf");
    }
    advance(3s);
    EXPECT_EQ(simulated.log.countContaining(", ... of 1000)"), 1U);
}

}  // namespace
}  // namespace typhon
