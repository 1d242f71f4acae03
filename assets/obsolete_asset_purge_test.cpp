#include "assets/asset_fixture.h"
#include "assets/obsolete_asset_purge.h"

namespace typhon {
namespace {

using Ids = std::vector<std::string>;

class ObsoleteAssetPurgeTest : public AssetTest {
protected:
    void addPrevious(const std::string& assetId, std::int64_t state)
    {
        simulated.assetService.add(
            asset_types::previousFonts,
            {.assetId = assetId, .state = state, .foundUnder = asset_return_types::listed});
    }
    void addCurrent(SimulatedAsset asset)
    {
        simulated.assetService.add(asset_types::fonts, std::move(asset));
    }
    void purgePrevious()
    {
        purge.removeObsoleteFontAsset();
        simulated.drain();
    }
    void purgeCurrent()
    {
        purge.purgeObsoleteAssets();
        simulated.drain();
    }

    ObsoleteAssetPurge purge{simulated.platform};
};

TEST_F(ObsoleteAssetPurgeTest, AssetsOfThePreviousGenerationArePurgedInAnyState)
{
    for (const std::int64_t state : {0, 1, 2, 3, 9}) {
        addPrevious("a" + std::to_string(state), state);
    }
    purgePrevious();
    EXPECT_EQ(simulated.assetService.purged(), (Ids{"a0", "a1", "a2", "a3", "a9"}));
    EXPECT_TRUE(hasLogged(LogLevel::debug, "purging obsolete asset a9 result:0"));
    const auto& query = simulated.assetService.queries().at(0);
    EXPECT_EQ(query.type, "com.vorlan.Cargon.Font6");
    EXPECT_EQ(query.returnTypes, 1);
    EXPECT_TRUE(query.doNotBlockBeforeFirstUnlock);
    EXPECT_TRUE(query.doNotBlockOnNetworkStatus);
}

TEST_F(ObsoleteAssetPurgeTest, OnlyObsoleteAssetsOfTheCurrentGenerationArePurged)
{
    addCurrent({.assetId = "listed", .state = 1, .foundUnder = 7});
    addCurrent({.assetId = "installed", .state = 2});
    addCurrent({.assetId = "obsolete", .state = 3});
    addCurrent({.assetId = "unknown", .state = 4});
    purgeCurrent();
    EXPECT_EQ(simulated.assetService.purged(), Ids{"obsolete"});
    EXPECT_TRUE(hasLogged(LogLevel::debug, "Obsolete font asset obsolete was purged."));
    const auto& query = simulated.assetService.queries().at(0);
    EXPECT_EQ(query.type, "com.vorlan.Cargon.Font7");
    EXPECT_EQ(query.returnTypes, 6);
    EXPECT_FALSE(query.doNotBlockBeforeFirstUnlock);
    EXPECT_FALSE(query.doNotBlockOnNetworkStatus);
}

TEST_F(ObsoleteAssetPurgeTest, TheErrorAloneDecidesWhatIsLogged)
{
    addCurrent({.assetId = "a", .state = 3, .purgeResult = 7});
    addCurrent({.assetId = "b", .state = 3, .purgeResult = 0, .purgeError = "it is in use"});
    purgeCurrent();
    EXPECT_TRUE(hasLogged(LogLevel::debug, "Obsolete font asset a was purged."));
    EXPECT_TRUE(hasLogged(LogLevel::error, "Purging obsolete font asset b failed (0) - it is in use"));
    EXPECT_EQ(simulated.log.entries().size(), 2U);
}

TEST_F(ObsoleteAssetPurgeTest, FailedQueriesAreSilent)
{
    addPrevious("a", 2);
    addCurrent({.assetId = "b", .state = 3});
    simulated.assetService.failNextQuery(1);
    purgePrevious();
    simulated.assetService.failNextQuery(1);
    purgeCurrent();
    EXPECT_EQ(simulated.assetService.purged(), Ids{});
    EXPECT_TRUE(simulated.log.entries().empty());
}

}  // namespace
}  // namespace typhon
