#pragma once

namespace typhon {

/// Following the asset catalogue.
class AssetCatalogueEvents {
public:
    /// `setupForAssetNotifications`. Its place in the start-up; no notification is followed yet.
    void setupForAssetNotifications() {}
};

}  // namespace typhon
