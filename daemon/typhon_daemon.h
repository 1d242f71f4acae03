#pragma once

#include "assets/asset_catalogue_events.h"
#include "assets/asset_directory_monitoring.h"
#include "assets/asset_synchronisation.h"
#include "assets/font_access_privacy_asset.h"
#include "assets/obsolete_asset_purge.h"
#include "clients/typhon_server.h"
#include "daemon/client_capabilities.h"
#include "daemon/start_up.h"
#include "deletion/scheduled_font_deletion.h"
#include "lifecycle/application_removal.h"
#include "platform/platform.h"
#include "registry/per_client_font_info.h"
#include "registry/user_font_registry.h"
#include "registry/user_font_updates.h"
#include "requests/font_name_resolution.h"
#include "requests/font_picker_requests.h"
#include "requests/font_requests.h"
#include "requests/issued_paths_ledger.h"
#include "requests/missing_fonts_dialog.h"

#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The daemon: one of each subsystem, the listener's decision about new connections, and the operations that
/// every client's handler passes on. Lives as long as the process; made with `make_shared`. Any thread, but
/// for the start-up steps and `run`, which are the main thread's.
class TyphonDaemon final : public TyphonServer,
                           public ListenerDelegate,
                           public StartUpSteps,
                           public std::enable_shared_from_this<TyphonDaemon> {
public:
    /// `sharedDaemon`. The process's daemon, made on first use over that platform and never destroyed. For
    /// `main` alone.
    static std::shared_ptr<TyphonDaemon> sharedDaemon(Platform& platform);

    /// `init`. Creates `mainHandlerQueue` and starts nothing. `platform` outlives this.
    explicit TyphonDaemon(Platform& platform);

    void setupForSluiceService() override;
    void setupForScheduledFontDeletion() override;
    void setupForDistributedNotifications() override;
    void setupForAssetNotifications() override;
    void setupForMonitoringFontAssets() override;
    void setupForProfileFonts() override;
    void setup() override;

    /// Hands the main thread to the main loop. Does not return on a real platform.
    void run();

    /// `listener:shouldAcceptNewConnection:`. Accepts everybody, each with a handler of its own; what a
    /// client may do is decided when it checks in, and for each of its requests.
    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override;

    Capabilities capabilitiesFor(const AuditToken& token) override;
    bool isCurrentConnectionFontPicker() override;
    PerClientFontInfo& perClientFontInfo() override { return perClientFontInfo_; }
    NotificationCenter& notificationCenter() override { return notificationCenter_; }
    FontChangeBroadcast& fontChangeBroadcast() override { return fontChangeBroadcast_; }
    WorkQueue& mainHandlerQueue() override { return *mainHandlerQueue_; }
    Ipc& ipc() override { return platform_.ipc; }
    Log& log() override { return platform_.log; }
    ClientCapabilities& clientCapabilities() { return clientCapabilities_; }
    UserFontRegistry& userFontRegistry() { return userFontRegistry_; }
    IssuedPathsLedger& issuedPathsLedger() { return issuedPathsLedger_; }
    MissingFontsDialog& missingFontsDialog() { return missingFontsDialog_; }
    FontRequests& fontRequests() { return fontRequests_; }
    AssetCatalogueEvents& assetCatalogueEvents() { return *assetCatalogueEvents_; }

    Task<void> requestFonts(PropertyList::Array requests, DictionaryReply reply) override;
    Task<void> requestFonts(std::string postScriptName, std::shared_ptr<ListenerEndpoint> forClient,
                            BooleanReply reply) override;
    Task<void> fontChanged(PropertyList change, EmptyReply reply) override;
    Task<void> updatingUserFonts(EmptyReply reply) override;
    Task<void> scheduleFontFilesDeletion(std::vector<std::string> paths) override;
    Task<void> synchronizeFontAssets(std::vector<std::string> paths, OutcomeReply reply) override;
    Task<void> resetIssuedFontsFor(std::string identifier, EmptyReply reply) override;

    // Answered by each client's handler: these throw, like a message to an object that does not know it. The
    // dispatch table lets none of them through.
    Task<void> checkin(OptionalDictionaryReply reply) override;
    Task<void> checkinForFontPicker(OptionalDictionaryReply reply) override;
    Task<void> sendFonts(PropertyList::Array fonts, EmptyReply reply) override;
    Task<void> checkinForSilkpageProcess(std::shared_ptr<ListenerEndpoint> endpoint,
                                         EmptyReply reply) override;

private:
    void loadFontAccessPrivacyAsset();

    Platform& platform_;
    std::shared_ptr<WorkQueue> mainHandlerQueue_;
    NotificationCenter notificationCenter_;
    ClientCapabilities clientCapabilities_;
    UserFontUpdates userFontUpdates_;
    UserFontRegistry userFontRegistry_;
    IssuedPathsLedger issuedPathsLedger_;
    PerClientFontInfo perClientFontInfo_;
    FontNameResolution fontNameResolution_;
    MissingFontsDialog missingFontsDialog_;
    FontRequests fontRequests_;
    FontPickerRequests fontPickerRequests_;
    FontChangeBroadcast fontChangeBroadcast_;
    const std::shared_ptr<ApplicationRemoval> applicationRemoval_;
    const std::shared_ptr<ScheduledFontDeletion> scheduledFontDeletion_;
    AssetSynchronisation assetSynchronisation_;
    ObsoleteAssetPurge obsoleteAssetPurge_;
    FontAccessPrivacyAsset fontAccessPrivacyAsset_;
    const std::shared_ptr<AssetCatalogueEvents> assetCatalogueEvents_;
    const std::shared_ptr<AssetDirectoryMonitoring> assetDirectoryMonitoring_;
};

}  // namespace typhon
