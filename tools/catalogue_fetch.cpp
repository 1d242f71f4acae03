#include "tools/catalogue_fetch.h"

#include "platform/linux/catalogue_source.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/linux_asset_service.h"
#include "tools/complaints.h"
#include "tools/notification_post.h"

#include <future>
#include <utility>

namespace typhon {

ClientResult<std::string> fetchCatalogue(const RootDirectory& root, const std::string& assetType)
{
    Complaints complaints;
    std::string notAnnounced;
    EventPool pool;
    LinuxAssetService assets(pool, complaints, root,
                             {.post =
                                  [&](const std::string& name) {
                                      if (const auto posted = postNotification(root, name, std::nullopt);
                                          !posted) {
                                          notAnnounced = "Not announced: " + posted.error().message + "\n";
                                      }
                                  },
                              .downloader = {}});
    std::promise<std::int64_t> promise;
    auto future = promise.get_future();
    assets.startCatalogDownload(assetType, {},
                                [&promise](std::int64_t result) { promise.set_value(result); });
    const auto result = future.get();
    pool.stop();
    switch (result) {
    case LinuxAssetService::results::success:
        return notAnnounced;
    case LinuxAssetService::results::noSource:
        return ClientError{{},
                           "no source is configured for the catalogue of " + assetType,
                           "Put a property list with the \"URL\" at " +
                               std::string(catalogueSourcesDirectory) + "/" + assetType + ".plist."};
    default:
        return ClientError{{}, complaints.text(), {}};
    }
}

}  // namespace typhon
