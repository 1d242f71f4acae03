#include "daemon/start_up.h"

namespace typhon {

void startUp(StartUpSteps& daemon)
{
    daemon.setupForSluiceService();
    daemon.setupForScheduledFontDeletion();
    daemon.setupForDistributedNotifications();
    daemon.setupForAssetNotifications();
    daemon.setupForMonitoringFontAssets();
    daemon.setupForProfileFonts();
    daemon.setup();
}

}  // namespace typhon
