#pragma once

#include "platform/platform.h"
#include "requests/issued_paths_ledger.h"

#include <memory>
#include <string>
#include <vector>

namespace typhon {

/// What follows when applications are removed from the device: their fonts are unregistered and their record
/// of issued fonts is forgotten. Made with `make_shared`; work that it posted and that has not run ends with
/// it. Any thread.
class ApplicationRemoval final : public std::enable_shared_from_this<ApplicationRemoval> {
public:
    /// Everything given outlives this, but for work on `mainHandlerQueue` that it posted itself.
    ApplicationRemoval(Platform& platform, IssuedPathsLedger& ledger, WorkQueue& mainHandlerQueue)
        : platform_(platform), ledger_(ledger), mainHandlerQueue_(mainHandlerQueue)
    {}

    /// `setupForDistributedNotifications`. From now on removals are followed as they are announced, on the
    /// main queue, which is held until all that an announcement asks for is done.
    void setupForDistributedNotifications();

    /// `synchronizeFontProviders`. Blocks on the disk.
    void synchronizeFontProviders();

    /// Removes what is left of applications that are not installed: the fonts of providers and the records of
    /// clients. For once after the start, because applications can go while the daemon is not running. An
    /// application that is there as a placeholder only counts as removed, one of which the registry of
    /// applications cannot tell does not. Returns before the unregistering is done. Blocks on the disk.
    void sweepStrayEntries();

private:
    void handleEvent(const PropertyList& event);
    static Task<void> forgetApplications(std::shared_ptr<ApplicationRemoval> self,
                                         std::vector<std::string> identifiers);
    Task<void> unregister(std::string identifier);
    void postForgettingOf(const std::string& identifier);
    void sweepStrayProviders();
    void sweepStrayClients();
    bool isStray(const std::string& identifier);

    Platform& platform_;
    IssuedPathsLedger& ledger_;
    WorkQueue& mainHandlerQueue_;
};

}  // namespace typhon
