#include "assets/asset_catalogue_events.h"

#include <array>
#include <string_view>
#include <utility>

namespace typhon {

namespace {

constexpr const char* checkAssetUpdate = "com.vorlan.typhond.check-asset-update";

struct Reaction {
    std::string_view notification;
    std::function<void()> AssetCatalogueEvents::Reactions::*work;
};
constexpr std::array reactionTable{
    Reaction{"com.vorlan.Cargon.Font7.kg.cached-metadata-updated",
             &AssetCatalogueEvents::Reactions::purgeObsoleteAssets},
    Reaction{"com.vorlan.Cargon.LetterformAssets.kg.new-asset-installed",
             &AssetCatalogueEvents::Reactions::loadFontAccessPrivacyAsset},
    Reaction{"com.vorlan.Cargon.LetterformAssets.kg.cached-metadata-updated",
             &AssetCatalogueEvents::Reactions::loadFontAccessPrivacyAsset},
};

/// The main queue lives as long as the platform.
std::shared_ptr<WorkQueue> unowned(WorkQueue& queue)
{
    return {std::shared_ptr<void>(), &queue};
}

}  // namespace

void AssetCatalogueEvents::setupForAssetNotifications()
{
    platform_.notifications.setEventStreamHandler(event_streams::notifyCentre,
                                                  unowned(platform_.queues.mainQueue()),
                                                  [weak = weak_from_this()](const PropertyList& event) {
                                                      if (const auto self = weak.lock()) {
                                                          self->handleEvent(event);
                                                      }
                                                  });
    platform_.backgroundActivities.registerActivity(
        checkAssetUpdate, [weak = weak_from_this()](const BackgroundActivity& activity) {
            if (const auto self = weak.lock()) {
                self->handleActivity(activity);
            }
        });
}

WorkQueue& AssetCatalogueEvents::assetHandlerQueue()
{
    return platform_.processWideQueues.serialQueue("com.vorlan.typhond.assetHandler");
}

std::uint64_t AssetCatalogueEvents::countFontAssets()
{
    const auto query = platform_.assetService.queryWithType(asset_types::fonts);
    query->returnTypes(asset_return_types::listed);
    query->queryMetaDataSync();
    return query->results().size();
}

void AssetCatalogueEvents::handleEvent(const PropertyList& event)
{
    const auto* value = event.find(event_streams::eventName);
    const auto* name = value == nullptr ? nullptr : value->asString();
    if (name == nullptr) {
        return;
    }
    for (const auto& reaction : reactionTable) {
        if (*name == reaction.notification) {
            assetHandlerQueue().async([weak = weak_from_this(), work = reaction.work] {
                if (const auto self = weak.lock()) {
                    (self->reactions_.*work)();
                }
            });
            return;
        }
    }
}

void AssetCatalogueEvents::handleActivity(const BackgroundActivity& activity)
{
    if (activity.state() == background_activity_states::checkIn) {
        return;
    }
    platform_.queues.concurrentQueue(Priority::background).async([weak = weak_from_this()] {
        if (const auto self = weak.lock()) {
            self->updateCatalogue();
        }
    });
}

void AssetCatalogueEvents::updateCatalogue()
{
    if (!registry_.isUserFontInstalled()) {
        return;
    }
    KGDownloadOptions options;
    options.setDiscretionary(true);
    platform_.assetService.startCatalogDownload(
        asset_types::letterform, options, [&log = platform_.log](std::int64_t result) {
            TYLog_Debug(log, "asset catalog updated. (" + std::to_string(result) + ")");
        });
}

}  // namespace typhon
