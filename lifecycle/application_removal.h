#pragma once

namespace typhon {

/// What follows when applications are removed from the device.
class ApplicationRemoval {
public:
    /// `setupForDistributedNotifications`. Its place in the start-up; no notification is followed yet.
    void setupForDistributedNotifications() {}
};

}  // namespace typhon
