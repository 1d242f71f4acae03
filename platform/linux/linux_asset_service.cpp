#include "platform/linux/linux_asset_service.h"

#include <algorithm>
#include <utility>

namespace typhon {

namespace {

class Asset final : public KGAsset {
public:
    Asset(EventPool& pool, AssetStore& store, std::string type, StoredAsset asset)
        : pool_(pool), store_(store), type_(std::move(type)), asset_(std::move(asset))
    {}

    PropertyList attributes() const override { return asset_.attributes; }
    std::int64_t state() const override { return asset_.state; }
    std::string assetId() const override { return asset_.assetId; }
    void purge(std::function<void(std::int64_t)> completion) override
    {
        purgeWithError(
            [completion = std::move(completion)](std::int64_t result, const std::optional<std::string>&) {
                if (completion) {
                    completion(result);
                }
            });
    }
    void purgeWithError(std::function<void(std::int64_t, std::optional<std::string>)> completion) override
    {
        pool_.post(
            [&store = store_, type = type_, assetId = asset_.assetId, completion = std::move(completion)] {
                auto error = store.purge(type, assetId);
                if (completion) {
                    completion(error ? 1 : 0, std::move(error));
                }
            });
    }

private:
    EventPool& pool_;
    AssetStore& store_;
    const std::string type_;
    const StoredAsset asset_;
};

std::int64_t returnTypesOf(std::int64_t state)
{
    switch (state) {
    case asset_states::listed:
        return asset_return_types::listed;
    case asset_states::installed:
        return asset_return_types::listed + asset_return_types::installed;
    default:
        return asset_return_types::obsolete;
    }
}

class Query final : public KGAssetQuery, public std::enable_shared_from_this<Query> {
public:
    Query(EventPool& pool, AssetStore& store, std::string type)
        : pool_(pool), store_(store), type_(std::move(type))
    {}

    void addKeyValuePair(const std::string& name, PropertyList with) override
    {
        matches_.emplace_back(name, std::move(with));
    }
    void returnTypes(std::int64_t types) override { types_ = types; }
    // Nothing here waits for an unlocking or for the network.
    void setDoNotBlockBeforeFirstUnlock(bool) override {}
    void setDoNotBlockOnNetworkStatus(bool) override {}

    void queryMetaData(std::function<void(std::int64_t)> completion) override
    {
        pool_.post([self = shared_from_this(), completion = std::move(completion)] {
            const auto result = self->queryMetaDataSync();
            if (completion) {
                completion(result);
            }
        });
    }
    std::int64_t queryMetaDataSync() override
    {
        auto listing = store_.assets(type_);
        if (listing.error) {
            return 1;
        }
        for (auto& asset : listing.assets) {
            if (answers(asset)) {
                results_.push_back(std::make_shared<Asset>(pool_, store_, type_, std::move(asset)));
            }
        }
        return 0;
    }
    std::vector<std::shared_ptr<KGAsset>> results() const override { return results_; }

private:
    bool answers(const StoredAsset& asset) const
    {
        const bool isAsked = !types_ || (returnTypesOf(asset.state) & *types_) != 0;
        return isAsked && std::ranges::all_of(matches_, [&](const auto& match) {
                   const auto found = asset.attributes.find(match.first);
                   return found != asset.attributes.end() && found->second == match.second;
               });
    }

    EventPool& pool_;
    AssetStore& store_;
    const std::string type_;
    std::vector<std::pair<std::string, PropertyList>> matches_;
    std::optional<std::int64_t> types_;
    std::vector<std::shared_ptr<KGAsset>> results_;
};

}  // namespace

LinuxAssetService::LinuxAssetService(EventPool& pool, Log& log, RootDirectory root)
    : pool_(pool), log_(log), root_(std::move(root)), store_(root_, log)
{}

std::shared_ptr<KGAssetQuery> LinuxAssetService::queryWithType(const std::string& type)
{
    return std::make_shared<Query>(pool_, store_, type);
}

void LinuxAssetService::startCatalogDownload(const std::string& type, KGDownloadOptions /*options*/,
                                             std::function<void(std::int64_t)> then)
{
    TYLog_Error(log_, "the catalogue of " + type + " is not fetched: this version cannot download");
    pool_.post([then = std::move(then)] {
        if (then) {
            then(downloadsUnsupported);
        }
    });
}

}  // namespace typhon
