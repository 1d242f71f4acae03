#pragma once

#include "platform/asset_service.h"
#include "platform/linux/asset_store.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <memory>

namespace typhon {

/// The asset service over the asset store on disk. Completions run on threads of the pool.
class LinuxAssetService final : public AssetService {
public:
    /// `pool` and `log` outlive this.
    LinuxAssetService(EventPool& pool, Log& log, RootDirectory root);

    std::shared_ptr<KGAssetQuery> queryWithType(const std::string& type) override;
    /// Catalogues are not fetched yet: logs so, and ends with `downloadsUnsupported`. They are replaced with
    /// `typhonctl assets`.
    void startCatalogDownload(const std::string& type, KGDownloadOptions options,
                              std::function<void(std::int64_t result)> then) override;

    static constexpr std::int64_t downloadsUnsupported = 95;

private:
    EventPool& pool_;
    Log& log_;
    const RootDirectory root_;
    AssetStore store_;
};

}  // namespace typhon
