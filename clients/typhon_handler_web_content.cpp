#include "clients/sluice_error.h"
#include "clients/typhon_handler.h"
#include "protocol/wire.h"

// Fonts for the processes in which an application shows web content. They hold no connection of their own:
// the application hands over an endpoint of each, and the daemon connects, asks who is there ("ping"), and
// passes on what the application may have, with grants that are issued to the content process itself. The
// connection serves that one exchange. As long as the content process owes an answer, nothing is held but the
// connection with its pending call; it counts as one of the content process's connections, ends with that
// process, and the application goes unanswered.

namespace typhon {

namespace {

constexpr const char* routine = "checkinForSilkpageProcess:reply:";

/// The application, as it was when it handed over the endpoint.
struct Application {
    AuditToken token;
    bool hasEnumeration = false;
    bool hasFontAccess = false;
    bool isFontProvider = false;
    std::optional<std::string> identifier;
};

/// One exchange with a content process.
struct WebContentCheckin {
    std::shared_ptr<TyphonServer> server;
    Application application;
    EmptyReply reply;
};
using Checkin = std::shared_ptr<const WebContentCheckin>;

/// Logs the error and ends the connection, which nobody would use any more.
ErrorHandler endingErrorHandler(Log& log, const std::weak_ptr<Connection>& weak)
{
    return [weak, &log](const IpcError& error) {
        sluiceErrorHandler(log, routine)(error);
        if (const auto connection = weak.lock()) {
            connection->invalidate();
        }
    };
}

Task<void> fontsAcknowledged(Checkin checkin)
{
    checkin->reply();
    if (const auto connection = currentConnection()) {
        connection->invalidate();
    }
    co_return;
}

void sendFonts(const Checkin& checkin, const std::shared_ptr<Connection>& connection,
               std::optional<PropertyList> info)
{
    connection->call(
        wire::userInstalledFontsInfo.interface, wire::userInstalledFontsInfo.member,
        {wire::nullable(std::move(info))}, [checkin](const Arguments&) { return fontsAcknowledged(checkin); },
        endingErrorHandler(checkin->server->log(), connection));
}

/// The content process answered: the current connection is its own.
Task<void> pingAnswered(Checkin checkin)
{
    const auto connection = currentConnection();
    const auto& application = checkin->application;
    auto settingUp = checkin->server->perClientFontInfo().setupUserInstalledFontsFor(
        currentAuditToken(), application.token, application.hasEnumeration, application.hasFontAccess,
        application.isFontProvider, application.identifier,
        [checkin, connection](std::optional<PropertyList> info) {
            sendFonts(checkin, connection, std::move(info));
        });
    co_await std::move(settingUp);
}

}  // namespace

Task<void> TyphonHandler::checkinForSilkpageProcess(std::shared_ptr<ListenerEndpoint> endpoint,
                                                    EmptyReply reply)
{
    const auto daemon = server();
    const auto checkin = std::make_shared<const WebContentCheckin>(
        WebContentCheckin{daemon,
                          {currentAuditToken(), hasEnumerationEntitlement_, hasFontAccessEntitlement_,
                           isFontProvider_, processIdentifier()},
                          std::move(reply)});
    const auto connection = daemon->ipc().connectionToEndpoint(std::move(endpoint));
    addWebContentProcessConnection(connection);
    watchWebContentProcessConnection(connection);
    connection->setRemoteObjectInterfaces(wire::typhonSilkpageSupportServerInterfaces());
    connection->resume();
    systemLog(daemon->log(), "TYSilkpage calling ping2");
    connection->call(
        wire::pingSilkpageProcess.interface, wire::pingSilkpageProcess.member, {},
        [checkin](const Arguments&) { return pingAnswered(checkin); },
        endingErrorHandler(daemon->log(), connection));
    co_return;
}

void TyphonHandler::watchWebContentProcessConnection(const std::shared_ptr<Connection>& connection)
{
    auto& log = server()->log();
    connection->setInvalidationHandler([&log, weakSelf = weak_from_this(), weak = std::weak_ptr(connection)] {
        systemLog(log, "TYSilkpage checkinForSilkpageProcess connection invalidationHandler.");
        const auto self = weakSelf.lock();
        const auto present = weak.lock();
        if (self && present) {
            self->removeWebContentProcessConnection(present);
        }
    });
    // For completeness: a connection to an endpoint ends with its peer, without being interrupted before.
    connection->setInterruptionHandler(
        [&log] { systemLog(log, "TYSilkpage checkinForSilkpageProcess connection interruptionHandler."); });
}

void TyphonHandler::addWebContentProcessConnection(std::shared_ptr<Connection> connection)
{
    const std::lock_guard lock(mutex_);
    // Intended, though the test reads the wrong way round: the array is made anew when there is one, and
    // there never is. No list of content processes is kept; their connections live by what is pending on
    // them.
    if (webcontentProcessConnections_) {
        webcontentProcessConnections_ = std::make_unique<std::vector<std::shared_ptr<Connection>>>();
    }
    if (webcontentProcessConnections_) {
        webcontentProcessConnections_->push_back(std::move(connection));
    }
}

void TyphonHandler::removeWebContentProcessConnection(const std::shared_ptr<Connection>& connection)
{
    const std::lock_guard lock(mutex_);
    if (webcontentProcessConnections_) {
        std::erase(*webcontentProcessConnections_, connection);
    }
}

}  // namespace typhon
