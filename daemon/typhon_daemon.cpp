#include "daemon/typhon_daemon.h"

#include "clients/typhon_handler.h"
#include "daemon/layout_version.h"
#include "daemon/operations.h"
#include "protocol/wire.h"

#include <stdexcept>

namespace typhon {

namespace {

Task<void> doesNotRecognizeSelector(const char* selector)
{
    throw std::logic_error(std::string("the daemon does not implement ") + selector);
    co_return;
}

}  // namespace

std::shared_ptr<TyphonDaemon> TyphonDaemon::sharedDaemon(Platform& platform)
{
    // Never destroyed: there is no orderly shutdown.
    static const auto& daemon = *new std::shared_ptr<TyphonDaemon>(std::make_shared<TyphonDaemon>(platform));
    return daemon;
}

TyphonDaemon::TyphonDaemon(Platform& platform)
    : platform_(platform), mainHandlerQueue_(platform.queues.createSerialQueue("com.vorlan.typhond")),
      clientCapabilities_(platform), userFontUpdates_(platform.processWideQueues),
      userFontRegistry_(platform.fileSystem, platform.log, userFontUpdates_),
      issuedPathsLedger_(platform.preferences, platform.codeSigning, userFontRegistry_),
      perClientFontInfo_(
          platform, userFontRegistry_, *mainHandlerQueue_,
          {[this](const AuditToken& token) { return clientCapabilities_.isAuditTokenSandboxed(token); },
           [this](const std::string& identifier) {
               return issuedPathsLedger_.issuedFontFilePathsForIdentifier(identifier);
           }}),
      fontNameResolution_(userFontRegistry_, platform.userFontManager),
      missingFontsDialog_(platform, fontNameResolution_, [this] { return weak_from_this(); }),
      fontRequests_({platform, *mainHandlerQueue_, userFontRegistry_, perClientFontInfo_, fontNameResolution_,
                     issuedPathsLedger_, missingFontsDialog_}),
      fontPickerRequests_(
          {platform, userFontRegistry_, perClientFontInfo_, fontNameResolution_, issuedPathsLedger_}),
      fontChangeBroadcast_(platform, userFontRegistry_, perClientFontInfo_, notificationCenter_,
                           *mainHandlerQueue_),
      applicationRemoval_(
          std::make_shared<ApplicationRemoval>(platform, issuedPathsLedger_, *mainHandlerQueue_)),
      scheduledFontDeletion_(std::make_shared<ScheduledFontDeletion>(
          platform, [removal = applicationRemoval_] { removal->sweepStrayEntries(); })),
      assetSynchronisation_(platform, perClientFontInfo_, *mainHandlerQueue_), obsoleteAssetPurge_(platform),
      fontAccessPrivacyAsset_(platform),
      assetCatalogueEvents_(std::make_shared<AssetCatalogueEvents>(
          platform, userFontRegistry_,
          AssetCatalogueEvents::Reactions{
              .purgeObsoleteAssets = [this] { obsoleteAssetPurge_.purgeObsoleteAssets(); },
              .loadFontAccessPrivacyAsset = [this] { loadFontAccessPrivacyAsset(); }})),
      assetDirectoryMonitoring_(std::make_shared<AssetDirectoryMonitoring>(platform))
{}

void TyphonDaemon::setupForSluiceService()
{
    // The transport keeps the listener alive.
    const auto service = platform_.ipc.listenerForService(wire::serviceName);
    service->setDelegate(weak_from_this());
    service->resume();
    userFontRegistry_.isUserFontInstalled();
}

void TyphonDaemon::setupForScheduledFontDeletion()
{
    scheduledFontDeletion_->setupForScheduledFontDeletion();
}

void TyphonDaemon::setupForDistributedNotifications()
{
    applicationRemoval_->setupForDistributedNotifications();
}

void TyphonDaemon::setupForAssetNotifications()
{
    assetCatalogueEvents_->setupForAssetNotifications();
}

void TyphonDaemon::setupForMonitoringFontAssets()
{
    assetDirectoryMonitoring_->setupForMonitoringFontAssets();
}

void TyphonDaemon::loadFontAccessPrivacyAsset()
{
    fontAccessPrivacyAsset_.load([weak = weak_from_this()](PropertyList list) {
        if (const auto self = weak.lock()) {
            self->clientCapabilities_.setFontEnumerationProhibitedInfo(std::move(list));
        }
    });
}

void TyphonDaemon::setupForProfileFonts()
{
    platform_.userFontManager.synchronizeProfileFonts([] {});
}

void TyphonDaemon::setup()
{
    migrateLayout(platform_.preferences, [this] { obsoleteAssetPurge_.removeObsoleteFontAsset(); });
}

void TyphonDaemon::run()
{
    platform_.queues.runMainLoop();
}

bool TyphonDaemon::listener(Listener& /*listener*/, std::shared_ptr<Connection> shouldAcceptNewConnection)
{
    const auto& connection = shouldAcceptNewConnection;
    connection->setExportedInterfaces(wire::typhonDaemonInterfaces());
    const auto handler = std::make_shared<ExportedHandler>(shared_from_this());
    connection->setExportedObject(handler);
    connection->setRemoteObjectInterfaces(wire::typhonClientInterfaces());
    // The handler holds its connection and the connection its handler, until this breaks the cycle.
    connection->setInvalidationHandler([handler] { handler->setClientConnection(nullptr); });
    handler->setClientConnection(connection);
    connection->resume();
    return true;
}

Capabilities TyphonDaemon::capabilitiesFor(const AuditToken& token)
{
    return clientCapabilities_.capabilitiesFor(token);
}

bool TyphonDaemon::isCurrentConnectionFontPicker()
{
    return clientCapabilities_.isCurrentConnectionFontPicker();
}

Task<void> TyphonDaemon::fontChanged(PropertyList change, EmptyReply reply)
{
    return fontChangeBroadcast_.fontChanged(std::move(change), std::move(reply));
}

Task<void> TyphonDaemon::updatingUserFonts(EmptyReply reply)
{
    return userFontUpdates_.updatingUserFonts(std::move(reply));
}

Task<void> TyphonDaemon::resetIssuedFontsFor(std::string identifier, EmptyReply reply)
{
    return issuedPathsLedger_.resetIssuedFontsFor(std::move(identifier), std::move(reply));
}

Task<void> TyphonDaemon::requestFonts(PropertyList::Array requests, DictionaryReply reply)
{
    return fontRequests_.requestFonts(std::move(requests), std::move(reply));
}

Task<void> TyphonDaemon::requestFonts(std::string postScriptName, std::shared_ptr<ListenerEndpoint> forClient,
                                      BooleanReply reply)
{
    return fontPickerRequests_.requestFonts(std::move(postScriptName), std::move(forClient),
                                            std::move(reply));
}

Task<void> TyphonDaemon::checkin(OptionalDictionaryReply /*reply*/)
{
    return doesNotRecognizeSelector("checkin:");
}

Task<void> TyphonDaemon::checkinForFontPicker(OptionalDictionaryReply /*reply*/)
{
    return doesNotRecognizeSelector("checkinForFontPicker:");
}

Task<void> TyphonDaemon::sendFonts(PropertyList::Array /*fonts*/, EmptyReply /*reply*/)
{
    return doesNotRecognizeSelector("sendFonts:reply:");
}

Task<void> TyphonDaemon::scheduleFontFilesDeletion(std::vector<std::string> paths)
{
    return scheduledFontDeletion_->scheduleFontFilesDeletion(std::move(paths));
}

Task<void> TyphonDaemon::synchronizeFontAssets(std::vector<std::string> paths, OutcomeReply reply)
{
    return assetSynchronisation_.synchronizeFontAssets(std::move(paths), std::move(reply));
}

Task<void> TyphonDaemon::checkinForSilkpageProcess(std::shared_ptr<ListenerEndpoint> /*endpoint*/,
                                                   EmptyReply /*reply*/)
{
    return doesNotRecognizeSelector("checkinForSilkpageProcess:reply:");
}

}  // namespace typhon
