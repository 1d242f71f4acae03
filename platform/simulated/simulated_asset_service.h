#pragma once

#include "platform/asset_service.h"
#include "platform/simulated/simulated_scheduler.h"

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace typhon {

/// An asset that a test puts into the simulated service.
struct SimulatedAsset {
    std::string assetId = {};
    std::int64_t state = asset_states::installed;
    PropertyList::Dictionary attributes = {};
    /// What a purge ends with. After a failure the asset stays.
    std::int64_t purgeResult = 0;
    std::optional<std::string> purgeError = std::nullopt;
    /// The return types under which it is found; null: those of its state.
    std::optional<std::int64_t> foundUnder = std::nullopt;
};

/// The asset service as a test sets it up. Queries, purges and downloads complete by themselves, later. One
/// thread.
class SimulatedAssetService final : public AssetService {
public:
    /// A query that was run.
    struct Query {
        std::string type;
        std::vector<std::pair<std::string, PropertyList>> matches;
        std::optional<std::int64_t> returnTypes;
        bool doNotBlockBeforeFirstUnlock = false;
        bool doNotBlockOnNetworkStatus = false;
    };
    struct Download {
        std::string type;
        bool isDiscretionary = false;
    };

    explicit SimulatedAssetService(SimulatedScheduler& scheduler) : scheduler_(scheduler) {}

    std::shared_ptr<KGAssetQuery> queryWithType(const std::string& type) override;
    void startCatalogDownload(const std::string& type, KGDownloadOptions options,
                              std::function<void(std::int64_t result)> then) override;

    /// Runs a query: its answer is that of the moment.
    std::int64_t answer(const Query& query, std::vector<std::shared_ptr<KGAsset>>& results);
    struct PurgeOutcome {
        std::int64_t result = 0;
        std::optional<std::string> error = std::nullopt;
    };
    /// Purges an asset, as it was found: with what it was set up to end with, if that is a failure.
    PurgeOutcome purge(const std::string& type, const SimulatedAsset& asset);
    /// Has `job` run later, on nobody's queue.
    void later(std::function<void()> job) { scheduler_.post(this, std::move(job)); }
    void notePurge(const std::string& assetId) { purged_.push_back(assetId); }

    void add(const std::string& type, SimulatedAsset asset) { assets_[type].push_back(std::move(asset)); }
    void removeAll(const std::string& type) { assets_.erase(type); }
    void failNextQuery(std::int64_t result) { nextQueryResult_ = result; }
    void setDownloadResult(std::int64_t result) { downloadResult_ = result; }

    const std::vector<Query>& queries() const { return queries_; }
    const std::vector<Download>& downloads() const { return downloads_; }
    /// The identifiers of the assets whose purge was asked for, in order.
    const std::vector<std::string>& purged() const { return purged_; }

private:
    SimulatedScheduler& scheduler_;
    std::map<std::string, std::vector<SimulatedAsset>> assets_;
    std::int64_t nextQueryResult_ = 0;
    std::int64_t downloadResult_ = 0;
    std::vector<Query> queries_;
    std::vector<Download> downloads_;
    std::vector<std::string> purged_;
};

}  // namespace typhon
