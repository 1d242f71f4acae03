#include "assets/font_access_privacy_asset.h"

#include <utility>

namespace typhon {

namespace {

PropertyList listFrom(const KGAssetQuery& query)
{
    PropertyList::Array list;
    for (const auto& asset : query.results()) {
        const auto attributes = asset->attributes();
        // Intended: taken as it is, whatever its type. Those who read the list look at what they find.
        if (const auto* prohibitions = attributes.find("FontAccess")) {
            list.push_back(*prohibitions);
        }
    }
    return list;
}

}  // namespace

void FontAccessPrivacyAsset::load(SetList setList)
{
    const auto query = platform_.assetService.queryWithType(asset_types::letterform);
    query->addKeyValuePair("_CompatibilityVersion", "1");
    query->addKeyValuePair("type", "FontAccess");
    query->queryMetaData([query, setList = std::move(setList)](std::int64_t result) {
        if (result == 0) {
            setList(listFrom(*query));
        }
    });
}

}  // namespace typhon
