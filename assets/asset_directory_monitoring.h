#pragma once

#include "platform/platform.h"

#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace typhon {

/// Keeping step with the files of the asset store: the font-registry library is asked to synchronise after
/// the start and after every batch of changes. Made with `make_shared`. Any thread.
class AssetDirectoryMonitoring : public std::enable_shared_from_this<AssetDirectoryMonitoring> {
public:
    /// `platform` outlives this.
    explicit AssetDirectoryMonitoring(Platform& platform) : platform_(platform) {}

    /// `setupForMonitoringFontAssets`. Returns at once. Watching begins when a first synchronisation has
    /// ended, in whatever way, and lasts as long as this.
    void setupForMonitoringFontAssets();

private:
    void startUp();
    void startWatching();
    void handleChanges(const std::vector<std::string>& paths);

    Platform& platform_;
    std::mutex mutex_;
    // Protected by mutex_.
    std::shared_ptr<WorkQueue> monitorQueue_;
    std::shared_ptr<FileEventStream> stream_;
};

}  // namespace typhon
