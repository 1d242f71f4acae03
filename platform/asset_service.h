#pragma once

#include "platform/property_list.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The types of assets that matter here.
namespace asset_types {
/// Downloadable fonts.
inline constexpr const char* fonts = "com.vorlan.Cargon.Font7";
/// Their previous generation.
inline constexpr const char* previousFonts = "com.vorlan.Cargon.Font6";
/// Assets of the text engine.
inline constexpr const char* letterform = "com.vorlan.Cargon.LetterformAssets";
}  // namespace asset_types

/// Where an asset stands. Numbers, because services may know more states than these.
namespace asset_states {
inline constexpr std::int64_t listed = 1;
inline constexpr std::int64_t installed = 2;
/// Installed, and not in the catalogue any more.
inline constexpr std::int64_t obsolete = 3;
}  // namespace asset_states

/// What a query returns: any of these, added up.
namespace asset_return_types {
/// Listed in the present catalogue, installed or not.
inline constexpr std::int64_t listed = 1;
/// Installed and listed.
inline constexpr std::int64_t installed = 2;
/// Installed and no longer listed.
inline constexpr std::int64_t obsolete = 4;
}  // namespace asset_return_types

/// One asset as a query found it. Any thread. Completions are called exactly once, later, on a thread of the
/// service's own; an empty one is allowed.
class KGAsset {
public:
    virtual ~KGAsset() = default;
    /// The asset's attributes, a dictionary.
    virtual PropertyList attributes() const = 0;
    virtual std::int64_t state() const = 0;
    virtual std::string assetId() const = 0;

    /// `purge:`. Removes the asset's files from the store. The result is 0 for success.
    virtual void purge(std::function<void(std::int64_t result)> completion) = 0;
    /// `purgeWithError:`. The same; the error says in words why it failed, and is null when it did not.
    virtual void
    purgeWithError(std::function<void(std::int64_t result, std::optional<std::string> error)> completion) = 0;
};

/// A question about the assets of one type: set up, then run once. One thread until it runs.
class KGAssetQuery {
public:
    virtual ~KGAssetQuery() = default;
    /// `addKeyValuePair:with:`. Only assets whose attribute of that name has that value.
    virtual void addKeyValuePair(const std::string& name, PropertyList with) = 0;
    /// `returnTypes:`. A sum of `asset_return_types`; without it, all.
    virtual void returnTypes(std::int64_t types) = 0;
    /// `setDoNotBlockBeforeFirstUnlock:`
    virtual void setDoNotBlockBeforeFirstUnlock(bool doNotBlock) = 0;
    /// `setDoNotBlockOnNetworkStatus:`
    virtual void setDoNotBlockOnNetworkStatus(bool doNotBlock) = 0;

    /// `queryMetaData:`. Returns at once; `completion` is called exactly once, later, on a thread of the
    /// service's own, with 0 for success; it may be empty. The query lives at least that long.
    virtual void queryMetaData(std::function<void(std::int64_t result)> completion) = 0;
    /// `queryMetaDataSync`. The same, blocking on the disk; gives the result.
    virtual std::int64_t queryMetaDataSync() = 0;
    /// What was found, in the service's order; empty before the query has succeeded.
    virtual std::vector<std::shared_ptr<KGAsset>> results() const = 0;
};

/// How to download.
class KGDownloadOptions {
public:
    /// `setDiscretionary:`. Whether the system may choose when, and take its time.
    void setDiscretionary(bool discretionary) { discretionary_ = discretionary; }
    bool discretionary() const { return discretionary_; }

private:
    bool discretionary_ = false;
};

/// The platform's asset service. Any thread. Outlives what it created.
class AssetService {
public:
    virtual ~AssetService() = default;
    /// `initWithType:` of `KGAssetQuery`.
    virtual std::shared_ptr<KGAssetQuery> queryWithType(const std::string& type) = 0;
    /// `startCatalogDownload:options:then:` of `KGAsset`. Fetches the catalogue of that type anew; returns at
    /// once. `then` is called exactly once, later, on a thread of the service's own, with 0 for success; it
    /// may be empty.
    virtual void startCatalogDownload(const std::string& type, KGDownloadOptions options,
                                      std::function<void(std::int64_t result)> then) = 0;
};

}  // namespace typhon
