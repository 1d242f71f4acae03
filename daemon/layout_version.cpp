#include "daemon/layout_version.h"

namespace typhon {

void migrateLayout(Preferences& preferences, const std::function<void()>& removeObsoleteFontAsset)
{
    if (preferences.integer("version") >= currentLayoutVersion) {
        return;
    }
    removeObsoleteFontAsset();
    preferences.setValue("version", currentLayoutVersion);
    preferences.synchronize();
}

}  // namespace typhon
