#pragma once

namespace typhon {

/// Keeping step with the files of the asset store.
class AssetDirectoryMonitoring {
public:
    /// `setupForMonitoringFontAssets`. Its place in the start-up; no directory is watched yet.
    void setupForMonitoringFontAssets() {}
};

}  // namespace typhon
