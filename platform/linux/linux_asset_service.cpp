#include "platform/linux/linux_asset_service.h"

#include "platform/linux/catalogue_source.h"
#include "platform/linux/visible_text.h"

#include <algorithm>
#include <utility>

namespace typhon {

namespace {

/// Slow enough to leave the network to others; the largest catalogue takes some four minutes.
constexpr std::uint64_t discretionaryBytesPerSecond = 256 << 10;

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
        // What is listed must not seem to be nothing because that cannot be read.
        const bool needsCatalogue = !types_ || (*types_ & asset_return_types::listed) != 0;
        if (listing.error || (needsCatalogue && listing.isCatalogueBroken)) {
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

LinuxAssetService::LinuxAssetService(EventPool& pool, Log& log, RootDirectory root, Options options)
    : pool_(pool), log_(log), root_(std::move(root)), options_(std::move(options)), store_(root_, log),
      downloads_(pool, root_, options_.downloader)
{}

std::shared_ptr<KGAssetQuery> LinuxAssetService::queryWithType(const std::string& type)
{
    return std::make_shared<Query>(pool_, store_, type);
}

void LinuxAssetService::startCatalogDownload(const std::string& type, KGDownloadOptions options,
                                             std::function<void(std::int64_t)> then)
{
    if (!then) {
        then = [](std::int64_t) {};
    }
    pool_.post([this, type, discretionary = options.discretionary(), then = std::move(then)]() mutable {
        download(type, discretionary, std::move(then));
    });
}

void LinuxAssetService::download(const std::string& type, bool discretionary, Then then)
{
    const auto [source, isConfigured] = catalogueSourceOf(root_, type);
    if (!source.value) {
        log_.write(LogSink::daemon, isConfigured ? LogLevel::error : LogLevel::defaultLevel,
                   "the catalogue of " + visibleText(type, 300) + " is not fetched: " + source.error);
        then(isConfigured ? results::notFetched : results::noSource);
        return;
    }
    const DownloadRequest request{.url = source.value->url,
                                  .certificates = source.value->certificates,
                                  .mostBytes = catalogueFileLimit,
                                  .bytesPerSecond = discretionary ? discretionaryBytesPerSecond : 0,
                                  .stallSeconds = source.value->stallSeconds,
                                  .totalSeconds = source.value->totalSeconds};
    downloads_.start(
        request, discretionary,
        [this, type, then = std::move(then)](const DownloadAnswer& answer) { then(accept(type, answer)); });
}

std::int64_t LinuxAssetService::accept(const std::string& type, const DownloadAnswer& answer)
{
    if (!answer.error.empty()) {
        TYLog_Error(log_, "the catalogue of " + type + " is not fetched: " + answer.error);
        return results::notFetched;
    }
    if (store_.replaceCatalogue(type, answer.contents)) {
        // The store has said why.
        return results::refused;
    }
    TYLog(log_, "the catalogue of " + type + " was fetched");
    if (options_.post) {
        options_.post(type + ".kg.cached-metadata-updated");
    }
    return results::success;
}

}  // namespace typhon
