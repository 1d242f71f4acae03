#pragma once

#include "platform/platform.h"
#include "registry/user_font_registry.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

namespace typhon {

/// Following the asset catalogues: what is done when the asset service announces changes, and the activity
/// that has the catalogue of the text engine's assets fetched now and then. Made with `make_shared`. Any
/// thread.
class AssetCatalogueEvents : public std::enable_shared_from_this<AssetCatalogueEvents> {
public:
    /// What is done on the asset queue. Each returns soon.
    struct Reactions {
        std::function<void()> purgeObsoleteAssets;
        std::function<void()> loadFontAccessPrivacyAsset;
    };

    /// Everything given outlives this.
    AssetCatalogueEvents(Platform& platform, UserFontRegistry& registry, Reactions reactions)
        : platform_(platform), registry_(registry), reactions_(std::move(reactions))
    {}

    /// `setupForAssetNotifications`. Follows the notifications and registers the activity, both for the life
    /// of the process.
    void setupForAssetNotifications();

    /// `assetHandlerQueue`. The serial queue of the reactions, made on first use and kept by the process.
    WorkQueue& assetHandlerQueue();

    /// `countFontAssets`. How many downloadable fonts the catalogue lists; 0 when it cannot be asked. Blocks
    /// on the disk.
    std::uint64_t countFontAssets();

private:
    void handleEvent(const PropertyList& event);
    void handleActivity(const BackgroundActivity& activity);
    void updateCatalogue();

    Platform& platform_;
    UserFontRegistry& registry_;
    const Reactions reactions_;
};

}  // namespace typhon
