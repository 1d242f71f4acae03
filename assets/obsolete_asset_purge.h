#pragma once

namespace typhon {

/// Removal of asset generations that are no longer used.
class ObsoleteAssetPurge {
public:
    /// `removeObsoleteFontAsset`. Part of the migration to the current layout; there are no assets to
    /// remove yet.
    void removeObsoleteFontAsset() {}
};

}  // namespace typhon
