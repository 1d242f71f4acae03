#pragma once

#include "platform/asset_service.h"
#include "platform/linux/asset_store.h"
#include "platform/linux/downloads.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <functional>
#include <memory>
#include <string>

namespace typhon {

/// The asset service over the asset store on disk. Catalogues come from the sources that are configured, by
/// processes of their own. Completions run on threads of the pool.
class LinuxAssetService final : public AssetService {
public:
    struct Options {
        /// Announces a notification to the whole system. Any thread; may be empty.
        std::function<void(const std::string& name)> post;
        /// See `Downloads`.
        std::string downloader;
    };

    /// `pool` and `log` outlive this; the pool is stopped before it is destroyed.
    LinuxAssetService(EventPool& pool, Log& log, RootDirectory root, Options options);
    LinuxAssetService(EventPool& pool, Log& log, RootDirectory root)
        : LinuxAssetService(pool, log, std::move(root), Options())
    {}

    std::shared_ptr<KGAssetQuery> queryWithType(const std::string& type) override;
    /// A fetched catalogue that counts and is not older takes the place of the present one; once that is on
    /// disk, it is announced as "<type>.kg.cached-metadata-updated", also when nothing in it is new: whoever
    /// follows the announcements may have missed the last one. Every other end is one line in the log. One of
    /// `results`.
    void startCatalogDownload(const std::string& type, KGDownloadOptions options,
                              std::function<void(std::int64_t result)> then) override;

    struct results {
        static constexpr std::int64_t success = 0;
        /// Nobody has configured a source.
        static constexpr std::int64_t noSource = 1;
        static constexpr std::int64_t notFetched = 2;
        /// It was fetched, and does not count.
        static constexpr std::int64_t refused = 3;
    };

private:
    using Then = std::function<void(std::int64_t result)>;
    void download(const std::string& type, bool discretionary, Then then);
    std::int64_t accept(const std::string& type, const DownloadAnswer& answer);

    EventPool& pool_;
    Log& log_;
    const RootDirectory root_;
    const Options options_;
    AssetStore store_;
    // Last, so that nothing arrives any more when the rest goes.
    Downloads downloads_;
};

}  // namespace typhon
