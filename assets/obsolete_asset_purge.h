#pragma once

#include "platform/platform.h"

namespace typhon {

/// Removal of font assets that are no longer used. Both purges return at once; what follows touches nothing
/// but the log and is not tried again when it fails. Any thread.
class ObsoleteAssetPurge {
public:
    /// `platform` outlives this and every purge.
    explicit ObsoleteAssetPurge(Platform& platform) : platform_(platform) {}

    /// `removeObsoleteFontAsset`. Purges every asset of the previous generation. Part of the migration to the
    /// current layout.
    void removeObsoleteFontAsset();

    /// Purges the assets of the current generation that are no longer in the catalogue.
    void purgeObsoleteAssets();

private:
    Platform& platform_;
};

}  // namespace typhon
