#pragma once

namespace typhon {

/// The steps of start-up. Each returns soon; clients may be served from the first one on.
class StartUpSteps {
public:
    virtual ~StartUpSteps() = default;
    /// Opens the service and loads the registry.
    virtual void setupForSluiceService() = 0;
    virtual void setupForScheduledFontDeletion() = 0;
    virtual void setupForDistributedNotifications() = 0;
    virtual void setupForAssetNotifications() = 0;
    virtual void setupForMonitoringFontAssets() = 0;
    virtual void setupForProfileFonts() = 0;
    /// Migrates what an older version left on the device.
    virtual void setup() = 0;
};

/// Takes the steps, in their order, on the calling thread, which is the main one.
void startUp(StartUpSteps& daemon);

}  // namespace typhon
