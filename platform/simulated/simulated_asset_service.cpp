#include "platform/simulated/simulated_asset_service.h"

#include <algorithm>

namespace typhon {

namespace {

class FoundAsset final : public KGAsset {
public:
    FoundAsset(SimulatedAssetService& service, std::string type, SimulatedAsset asset)
        : service_(service), type_(std::move(type)), asset_(std::move(asset))
    {}

    PropertyList attributes() const override { return asset_.attributes; }
    std::int64_t state() const override { return asset_.state; }
    std::string assetId() const override { return asset_.assetId; }
    void purge(std::function<void(std::int64_t)> completion) override
    {
        purgeWithError([completion = std::move(completion)](std::int64_t result, const auto& /*error*/) {
            if (completion) {
                completion(result);
            }
        });
    }
    void purgeWithError(std::function<void(std::int64_t, std::optional<std::string>)> completion) override
    {
        service_.notePurge(asset_.assetId);
        service_.later(
            [&service = service_, type = type_, asset = asset_, completion = std::move(completion)] {
                auto [result, error] = service.purge(type, asset);
                if (completion) {
                    completion(result, std::move(error));
                }
            });
    }

private:
    SimulatedAssetService& service_;
    const std::string type_;
    const SimulatedAsset asset_;
};

class Query final : public KGAssetQuery, public std::enable_shared_from_this<Query> {
public:
    Query(SimulatedAssetService& service, const std::string& type) : service_(service) { asked_.type = type; }

    void addKeyValuePair(const std::string& name, PropertyList with) override
    {
        asked_.matches.emplace_back(name, std::move(with));
    }
    void returnTypes(std::int64_t types) override { asked_.returnTypes = types; }
    void setDoNotBlockBeforeFirstUnlock(bool doNotBlock) override
    {
        asked_.doNotBlockBeforeFirstUnlock = doNotBlock;
    }
    void setDoNotBlockOnNetworkStatus(bool doNotBlock) override
    {
        asked_.doNotBlockOnNetworkStatus = doNotBlock;
    }
    void queryMetaData(std::function<void(std::int64_t)> completion) override
    {
        service_.later([self = shared_from_this(), completion = std::move(completion)] {
            const auto result = self->queryMetaDataSync();
            if (completion) {
                completion(result);
            }
        });
    }
    std::int64_t queryMetaDataSync() override { return service_.answer(asked_, results_); }
    std::vector<std::shared_ptr<KGAsset>> results() const override { return results_; }

private:
    SimulatedAssetService& service_;
    SimulatedAssetService::Query asked_;
    std::vector<std::shared_ptr<KGAsset>> results_;
};

std::int64_t returnTypesOf(const SimulatedAsset& asset)
{
    if (asset.foundUnder) {
        return *asset.foundUnder;
    }
    switch (asset.state) {
    case asset_states::listed:
        return asset_return_types::listed;
    case asset_states::installed:
        return asset_return_types::listed + asset_return_types::installed;
    default:
        return asset_return_types::obsolete;
    }
}

bool answers(const SimulatedAsset& asset, const SimulatedAssetService::Query& query)
{
    const bool isAsked = !query.returnTypes || (returnTypesOf(asset) & *query.returnTypes) != 0;
    return isAsked && std::ranges::all_of(query.matches, [&](const auto& match) {
               const auto found = asset.attributes.find(match.first);
               return found != asset.attributes.end() && found->second == match.second;
           });
}

}  // namespace

std::shared_ptr<KGAssetQuery> SimulatedAssetService::queryWithType(const std::string& type)
{
    return std::make_shared<typhon::Query>(*this, type);
}

std::int64_t SimulatedAssetService::answer(const Query& query, std::vector<std::shared_ptr<KGAsset>>& results)
{
    queries_.push_back(query);
    if (nextQueryResult_ != 0) {
        return std::exchange(nextQueryResult_, 0);
    }
    for (const auto& asset : assets_[query.type]) {
        if (answers(asset, query)) {
            results.push_back(std::make_shared<FoundAsset>(*this, query.type, asset));
        }
    }
    return 0;
}

void SimulatedAssetService::startCatalogDownload(const std::string& type, KGDownloadOptions options,
                                                 std::function<void(std::int64_t)> then)
{
    downloads_.push_back({type, options.discretionary()});
    later([then = std::move(then), result = downloadResult_] {
        if (then) {
            then(result);
        }
    });
}

SimulatedAssetService::PurgeOutcome SimulatedAssetService::purge(const std::string& type,
                                                                 const SimulatedAsset& asset)
{
    if (asset.purgeResult != 0 || asset.purgeError) {
        return {asset.purgeResult, asset.purgeError};
    }
    auto& assets = assets_[type];
    const auto found = std::ranges::find(assets, asset.assetId, &SimulatedAsset::assetId);
    if (found == assets.end() || found->state == asset_states::listed) {
        return {1, asset.assetId + " is not installed"};
    }
    if (found->state == asset_states::installed) {
        found->state = asset_states::listed;
    } else {
        assets.erase(found);
    }
    return {};
}

}  // namespace typhon
