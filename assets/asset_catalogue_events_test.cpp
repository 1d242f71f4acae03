#include "assets/asset_catalogue_events.h"
#include "assets/asset_fixture.h"

namespace typhon {
namespace {

using Calls = std::vector<std::string>;

constexpr const char* fontMetadata = "com.vorlan.Cargon.Font7.kg.cached-metadata-updated";
constexpr const char* privacyInstalled = "com.vorlan.Cargon.LetterformAssets.kg.new-asset-installed";
constexpr const char* privacyMetadata = "com.vorlan.Cargon.LetterformAssets.kg.cached-metadata-updated";
constexpr const char* activity = "com.vorlan.typhond.check-asset-update";

class AssetCatalogueEventsTest : public AssetTest {
protected:
    AssetCatalogueEventsTest() { events->setupForAssetNotifications(); }

    void note(const std::string& what)
    {
        calls.push_back(what + " on " + WorkItem::current()->queue.label());
    }

    Calls calls;
    std::shared_ptr<AssetCatalogueEvents> events = std::make_shared<AssetCatalogueEvents>(
        simulated.platform, registry,
        AssetCatalogueEvents::Reactions{.purgeObsoleteAssets = [this] { note("purge"); },
                                        .loadFontAccessPrivacyAsset = [this] { note("load"); }});
    const std::string purge = "purge on com.vorlan.typhond.assetHandler";
    const std::string load = "load on com.vorlan.typhond.assetHandler";
};

TEST_F(AssetCatalogueEventsTest, EachNotificationHasItsReactionInTheOrderOfArrival)
{
    simulated.notifications.deliverNotifyCentre(privacyInstalled);
    simulated.notifications.deliverNotifyCentre(fontMetadata);
    simulated.notifications.deliverNotifyCentre(privacyMetadata);
    simulated.drain();
    EXPECT_EQ(calls, (Calls{load, purge, load}));
}

TEST_F(AssetCatalogueEventsTest, OtherEventsTriggerNothing)
{
    simulated.notifications.deliver(event_streams::notifyCentre, PropertyList::Dictionary{});
    simulated.notifications.deliver(event_streams::notifyCentre, "no dictionary");
    simulated.notifications.deliver(event_streams::notifyCentre,
                                    PropertyList::Dictionary{{event_streams::eventName, 7}});
    for (const char* name : {"", "com.vorlan.Cargon.Font7.kg.new-asset-installed",
                             "com.vorlan.Cargon.Font6.kg.cached-metadata-updated",
                             "com.vorlan.Cargon.LetterformAssets.kg.cached-metadata-removed",
                             "com.vorlan.Cargon.Font7.kg.cached-metadata-updated2"}) {
        simulated.notifications.deliverNotifyCentre(name);
    }
    simulated.drain();
    EXPECT_EQ(calls, Calls{});
}

TEST_F(AssetCatalogueEventsTest, TheAssetQueueIsOne)
{
    EXPECT_EQ(&events->assetHandlerQueue(), &events->assetHandlerQueue());
    EXPECT_EQ(events->assetHandlerQueue().label(), "com.vorlan.typhond.assetHandler");
}

TEST_F(AssetCatalogueEventsTest, TheActivityFetchesTheCatalogueAtTheSystemsDiscretion)
{
    register_({{fontAssets + "abc.asset/a.ttf", fontEntry("A")}});
    simulated.assetService.setDownloadResult(-3);
    simulated.backgroundActivities.call(activity, background_activity_states::run);
    EXPECT_TRUE(simulated.assetService.downloads().empty()) << "not in the handler itself";
    simulated.drain();
    ASSERT_EQ(simulated.assetService.downloads().size(), 1U);
    EXPECT_EQ(simulated.assetService.downloads()[0].type, asset_types::letterform);
    EXPECT_TRUE(simulated.assetService.downloads()[0].isDiscretionary);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "asset catalog updated. (-3)"));
    EXPECT_EQ(calls, Calls{}) << "what the download brings is announced by a notification only";
}

TEST_F(AssetCatalogueEventsTest, TheCheckInStateTriggersNoDownload)
{
    register_({{fontAssets + "abc.asset/a.ttf", fontEntry("A")}});
    simulated.backgroundActivities.call(activity, background_activity_states::checkIn);
    simulated.drain();
    EXPECT_TRUE(simulated.assetService.downloads().empty());
}

TEST_F(AssetCatalogueEventsTest, WithoutUserFontsNothingIsDownloaded)
{
    register_({});
    simulated.backgroundActivities.call(activity, background_activity_states::run);
    simulated.drain();
    EXPECT_TRUE(simulated.assetService.downloads().empty());
}

TEST_F(AssetCatalogueEventsTest, FontAssetsAreCountedAsTheCatalogueListsThem)
{
    EXPECT_EQ(events->countFontAssets(), 0U);
    simulated.assetService.add(asset_types::fonts, {.assetId = "listed", .state = asset_states::listed});
    simulated.assetService.add(asset_types::fonts,
                               {.assetId = "installed", .state = asset_states::installed});
    simulated.assetService.add(asset_types::fonts, {.assetId = "obsolete", .state = asset_states::obsolete});
    EXPECT_EQ(events->countFontAssets(), 2U);
    const auto& query = simulated.assetService.queries().back();
    EXPECT_EQ(query.type, "com.vorlan.Cargon.Font7");
    EXPECT_EQ(query.returnTypes, 1);
    EXPECT_TRUE(query.matches.empty());
    EXPECT_FALSE(query.doNotBlockBeforeFirstUnlock);
    EXPECT_FALSE(query.doNotBlockOnNetworkStatus);
    simulated.assetService.failNextQuery(5);
    EXPECT_EQ(events->countFontAssets(), 0U);
}

}  // namespace
}  // namespace typhon
