#include "clients/typhon_handler.h"

#include "clients/sluice_error.h"
#include "protocol/wire.h"

namespace typhon {

TyphonHandler::TyphonHandler(std::shared_ptr<TyphonServer> typhonDaemon) : server_(std::move(typhonDaemon)) {}

TyphonHandler::~TyphonHandler()
{
    const auto daemon = server();
    if (daemon) {
        daemon->notificationCenter().removeObserver(this);
        TYLog_Debug(daemon->log(), "TyphonHandler deallocated.");
    }
}

Task<void> TyphonHandler::checkin(OptionalDictionaryReply reply)
{
    const auto daemon = server();
    const auto token = currentAuditToken();
    const auto capabilities = daemon->capabilitiesFor(token);
    hasEnumerationEntitlement_ = capabilities.allowEnumerate;
    hasFontAccessEntitlement_ = capabilities.allowUserFonts;
    isFontProvider_ = capabilities.allowInstallation;
    if (isProcessIdentifierToIgnore(capabilities.identifier)) {
        reply(std::nullopt);
        co_return;
    }
    if (isFontProvider_) {
        // Before the first change can come, which a provider without a name would miss.
        const auto& identifier = capabilities.identifier;
        const std::lock_guard lock(mutex_);
        processIdentifier_ = identifier ? std::make_unique<const std::string>(*identifier) : nullptr;
    }
    daemon->notificationCenter().addObserver(shared_from_this(), "fontChanged", &TyphonHandler::fontChanged);
    auto answering = daemon->perClientFontInfo().setupUserInstalledFontsFor(
        token, token, capabilities.allowEnumerate, capabilities.allowUserFonts,
        capabilities.allowInstallation, capabilities.identifier, std::move(reply));
    co_await std::move(answering);
    TYLog_Debug(daemon->log(), "connected: " + capabilities.identifier.value_or("(null)"));
}

Task<void> TyphonHandler::checkinForFontPicker(OptionalDictionaryReply reply)
{
    const auto daemon = server();
    if (!daemon->isCurrentConnectionFontPicker()) {
        reply(std::nullopt);
        co_return;
    }
    std::function<void()> answer = [this, reply] {
        hasEnumerationEntitlement_ = true;
        reply(fontPickerReply(currentAuditToken()));
    };
    auto answering = daemon->mainHandlerQueue().perform(std::move(answer));
    co_await std::move(answering);
}

PropertyList TyphonHandler::fontPickerReply(const AuditToken& token)
{
    auto& fontInfo = server()->perClientFontInfo();
    PropertyList::Dictionary reply;
    reply.emplace("fontsInfo",
                  fontInfo.fontInfoForAuditToken(token, true, false, std::nullopt, std::nullopt, nullptr));
    if (auto extension = fontInfo.sandboxExtensionForEnumeration(token)) {
        reply.emplace("extension", *std::move(extension));
    }
    if (auto extension = fontInfo.sandboxExtensionForFontAssets(token)) {
        reply.emplace("extension.fontasset", *std::move(extension));
    }
    return reply;
}

Task<void> TyphonHandler::sendFonts(PropertyList::Array /*fonts*/, EmptyReply /*reply*/)
{
    // Intended: accepted, ignored, and never answered.
    co_return;
}

Task<void> TyphonHandler::requestFonts(PropertyList::Array requests, DictionaryReply reply)
{
    return server()->requestFonts(std::move(requests), std::move(reply));
}

Task<void> TyphonHandler::requestFonts(std::string postScriptName,
                                       std::shared_ptr<ListenerEndpoint> forClient, BooleanReply reply)
{
    return server()->requestFonts(std::move(postScriptName), std::move(forClient), std::move(reply));
}

Task<void> TyphonHandler::fontChanged(PropertyList change, EmptyReply reply)
{
    return server()->fontChanged(std::move(change), std::move(reply));
}

Task<void> TyphonHandler::updatingUserFonts(EmptyReply reply)
{
    return server()->updatingUserFonts(std::move(reply));
}

Task<void> TyphonHandler::scheduleFontFilesDeletion(std::vector<std::string> paths)
{
    return server()->scheduleFontFilesDeletion(std::move(paths));
}

Task<void> TyphonHandler::synchronizeFontAssets(std::vector<std::string> paths, OutcomeReply reply)
{
    return server()->synchronizeFontAssets(std::move(paths), std::move(reply));
}

Task<void> TyphonHandler::resetIssuedFontsFor(std::string identifier, EmptyReply reply)
{
    return server()->resetIssuedFontsFor(std::move(identifier), std::move(reply));
}

bool TyphonHandler::isProcessIdentifierToIgnore(const std::optional<std::string>& identifier)
{
    return identifier == "com.vorlan.Typhon.UserFontManager";
}

void TyphonHandler::fontChanged(const PropertyList& notification)
{
    const auto daemon = server();
    const auto connection = clientConnection();
    // Intended: a client whose connection is gone is worked for all the same, and nothing delivered to it.
    const auto share = daemon->fontChangeBroadcast()
                           .sharesIn(notification)
                           ->shareOf({connection ? connection->auditToken() : AuditToken{},
                                      hasEnumerationEntitlement_, isFontProvider_, processIdentifier()});
    if (share && connection) {
        connection->send(wire::fontAddedInfo.interface, wire::fontAddedInfo.member, *share,
                         sluiceErrorHandler(daemon->log(), "fontChanged:"));
    }
}

std::optional<std::string> TyphonHandler::processIdentifier() const
{
    const std::lock_guard lock(mutex_);
    return processIdentifier_ ? std::optional(*processIdentifier_) : std::nullopt;
}

std::shared_ptr<Connection> TyphonHandler::clientConnection() const
{
    const std::lock_guard lock(mutex_);
    return clientConnection_;
}

void TyphonHandler::setClientConnection(std::shared_ptr<Connection> connection)
{
    // The previous one is let go of after the lock: that may run the connection's teardown.
    const std::lock_guard lock(mutex_);
    clientConnection_.swap(connection);
}

std::shared_ptr<TyphonServer> TyphonHandler::server() const
{
    const std::lock_guard lock(mutex_);
    return server_;
}

void TyphonHandler::setServer(std::shared_ptr<TyphonServer> server)
{
    const std::lock_guard lock(mutex_);
    server_.swap(server);
}

std::optional<std::vector<std::shared_ptr<Connection>>> TyphonHandler::webcontentProcessConnections() const
{
    const std::lock_guard lock(mutex_);
    return webcontentProcessConnections_ ? std::optional(*webcontentProcessConnections_) : std::nullopt;
}

}  // namespace typhon
