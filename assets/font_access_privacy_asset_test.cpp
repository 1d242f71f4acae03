#include "assets/asset_fixture.h"
#include "assets/font_access_privacy_asset.h"

#include <optional>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

class FontAccessPrivacyAssetTest : public AssetTest {
protected:
    void load()
    {
        asset.load([this](PropertyList loaded) { list = std::move(loaded); });
        simulated.drain();
    }
    void add(Dictionary attributes)
    {
        simulated.assetService.add(asset_types::letterform,
                                   {.assetId = "privacy", .attributes = std::move(attributes)});
    }
    void addMatching(Dictionary attributes)
    {
        attributes.emplace("_CompatibilityVersion", "1");
        attributes.emplace("type", "FontAccess");
        add(std::move(attributes));
    }

    FontAccessPrivacyAsset asset{simulated.platform};
    std::optional<PropertyList> list;
    const Dictionary first{{"com.example.reader", Array{"2.0", "2.1"}}};
    const Dictionary second{{"com.example.writer", Array{"1.0"}}};
};

TEST_F(FontAccessPrivacyAssetTest, AsksForTheAssetsOfItsVersionAndKind)
{
    load();
    ASSERT_EQ(simulated.assetService.queries().size(), 1U);
    const auto& query = simulated.assetService.queries()[0];
    EXPECT_EQ(query.type, "com.vorlan.Cargon.LetterformAssets");
    using Match = std::pair<std::string, PropertyList>;
    EXPECT_EQ(query.matches, (std::vector<Match>{{"_CompatibilityVersion", "1"}, {"type", "FontAccess"}}));
    EXPECT_EQ(query.returnTypes, std::nullopt);
    EXPECT_FALSE(query.doNotBlockBeforeFirstUnlock);
    EXPECT_FALSE(query.doNotBlockOnNetworkStatus);
}

TEST_F(FontAccessPrivacyAssetTest, TwoAssetsGiveAListOfTwoInTheirOrder)
{
    addMatching({{"FontAccess", second}});
    addMatching({{"FontAccess", first}});
    load();
    EXPECT_EQ(list, PropertyList(Array{second, first}));
}

TEST_F(FontAccessPrivacyAssetTest, AssetsWithoutTheAttributeAreSkippedAndOthersTakenAsTheyAre)
{
    addMatching({{"Other", first}});
    addMatching({{"FontAccess", "no dictionary"}});
    addMatching({{"FontAccess", first}});
    addMatching({{"FontAccess", first}});
    load();
    EXPECT_EQ(list, PropertyList(Array{"no dictionary", first, first}));
}

TEST_F(FontAccessPrivacyAssetTest, AssetsOfOtherKindsAreNotLookedAt)
{
    add({{"_CompatibilityVersion", "2"}, {"type", "FontAccess"}, {"FontAccess", first}});
    add({{"_CompatibilityVersion", 1}, {"type", "FontAccess"}, {"FontAccess", first}});
    add({{"_CompatibilityVersion", "1"}, {"type", "Letterforms"}, {"FontAccess", first}});
    load();
    EXPECT_EQ(list, PropertyList(Array{}));
}

TEST_F(FontAccessPrivacyAssetTest, ASuccessfulQueryWithoutAssetsEmptiesTheList)
{
    addMatching({{"FontAccess", first}});
    load();
    simulated.assetService.removeAll(asset_types::letterform);
    load();
    EXPECT_EQ(list, PropertyList(Array{}));
}

TEST_F(FontAccessPrivacyAssetTest, AFailedQueryKeepsTheListInSilence)
{
    addMatching({{"FontAccess", first}});
    load();
    simulated.assetService.removeAll(asset_types::letterform);
    simulated.assetService.failNextQuery(-1);
    load();
    EXPECT_EQ(list, PropertyList(Array{first}));
    EXPECT_TRUE(simulated.log.entries().empty());
}

}  // namespace
}  // namespace typhon
