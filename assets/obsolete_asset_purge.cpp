#include "assets/obsolete_asset_purge.h"

#include <optional>
#include <string>

namespace typhon {

namespace {

void purgePrevious(KGAsset& asset, Log& log)
{
    asset.purge([&log, assetId = asset.assetId()](std::int64_t result) {
        TYLog_Debug(log, "purging obsolete asset " + assetId + " result:" + std::to_string(result));
    });
}

void purgeObsolete(KGAsset& asset, Log& log)
{
    const auto assetId = asset.assetId();
    asset.purgeWithError([&log, assetId](std::int64_t result, const std::optional<std::string>& error) {
        // Intended: the error alone decides, whatever the result.
        if (error) {
            TYLog_Error(log, "Purging obsolete font asset " + assetId + " failed (" + std::to_string(result) +
                                 ") - " + *error);
        } else {
            TYLog_Debug(log, "Obsolete font asset " + assetId + " was purged.");
        }
    });
}

}  // namespace

void ObsoleteAssetPurge::removeObsoleteFontAsset()
{
    const auto query = platform_.assetService.queryWithType(asset_types::previousFonts);
    query->returnTypes(asset_return_types::listed);
    query->setDoNotBlockBeforeFirstUnlock(true);
    query->setDoNotBlockOnNetworkStatus(true);
    query->queryMetaData([query, &log = platform_.log](std::int64_t result) {
        if (result != 0) {
            return;
        }
        for (const auto& asset : query->results()) {
            purgePrevious(*asset, log);
        }
    });
}

void ObsoleteAssetPurge::purgeObsoleteAssets()
{
    const auto query = platform_.assetService.queryWithType(asset_types::fonts);
    query->returnTypes(asset_return_types::installed + asset_return_types::obsolete);
    query->queryMetaData([query, &log = platform_.log](std::int64_t result) {
        if (result != 0) {
            return;
        }
        for (const auto& asset : query->results()) {
            if (asset->state() == asset_states::obsolete) {
                purgeObsolete(*asset, log);
            }
        }
    });
}

}  // namespace typhon
