#pragma once

#include "platform/platform.h"

#include <functional>

namespace typhon {

/// Loads the list of application versions that may not enumerate fonts, which is delivered as assets. Any
/// thread.
class FontAccessPrivacyAsset {
public:
    /// `setFontEnumerationProhibitedInfo:`. Any thread, also one of the asset service's.
    using SetList = std::function<void(PropertyList list)>;

    /// `platform` outlives this and every load.
    explicit FontAccessPrivacyAsset(Platform& platform) : platform_(platform) {}

    /// Starts a load and returns. When the assets could be asked for, the list becomes theirs, even if there
    /// are none; else it stays as it is. `setList` may be called after this is gone.
    void load(SetList setList);

private:
    Platform& platform_;
};

}  // namespace typhon
