#pragma once

#include "clients/typhon_server.h"
#include "platform/ipc.h"

#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The object behind one client's connection. Answers the check-in, remembers what the client may do for as
/// long as it is connected, and passes everything else on to the daemon. Holds its connection until that is
/// invalidated, and the daemon for good. Accessors may be called from any thread.
class TyphonHandler : public TyphonDaemonProtocol, public std::enable_shared_from_this<TyphonHandler> {
public:
    /// `initWithTyphonDaemon:`
    explicit TyphonHandler(std::shared_ptr<TyphonServer> typhonDaemon);
    ~TyphonHandler() override;
    TyphonHandler(const TyphonHandler&) = delete;
    TyphonHandler& operator=(const TyphonHandler&) = delete;

    Task<void> checkin(OptionalDictionaryReply reply) override;
    Task<void> checkinForFontPicker(OptionalDictionaryReply reply) override;
    Task<void> sendFonts(PropertyList::Array fonts, EmptyReply reply) override;
    Task<void> checkinForSilkpageProcess(std::shared_ptr<ListenerEndpoint> endpoint,
                                         EmptyReply reply) override;

    // Passed on to the daemon unchanged.
    Task<void> requestFonts(PropertyList::Array requests, DictionaryReply reply) override;
    Task<void> requestFonts(std::string postScriptName, std::shared_ptr<ListenerEndpoint> forClient,
                            BooleanReply reply) override;
    Task<void> fontChanged(PropertyList change, EmptyReply reply) override;
    Task<void> updatingUserFonts(EmptyReply reply) override;
    Task<void> scheduleFontFilesDeletion(std::vector<std::string> paths) override;
    Task<void> synchronizeFontAssets(std::vector<std::string> paths, OutcomeReply reply) override;
    Task<void> resetIssuedFontsFor(std::string identifier, EmptyReply reply) override;

    /// `isProcessIdentifierToIgnore:`. True for the font-registry library's own helper, which is no client.
    static bool isProcessIdentifierToIgnore(const std::optional<std::string>& identifier);

    /// `fontChanged:`. The observer of the notification "fontChanged", from check-in until destruction: sends
    /// the client its share in the change. On `mainHandlerQueue`.
    void fontChanged(const PropertyList& notification);

    bool hasEnumerationEntitlement() const { return hasEnumerationEntitlement_; }
    bool hasFontAccessEntitlement() const { return hasFontAccessEntitlement_; }
    bool isFontProvider() const { return isFontProvider_; }
    /// The signing identifier; kept for font providers only.
    std::optional<std::string> processIdentifier() const;
    /// Null once the connection is invalidated.
    std::shared_ptr<Connection> clientConnection() const;
    void setClientConnection(std::shared_ptr<Connection> connection);
    std::shared_ptr<TyphonServer> server() const;
    void setServer(std::shared_ptr<TyphonServer> server);
    /// The connections to the client's web-content processes, or null, which it stays.
    std::optional<std::vector<std::shared_ptr<Connection>>> webcontentProcessConnections() const;
    /// `addWebContentProcessConnection:`
    void addWebContentProcessConnection(std::shared_ptr<Connection> connection);

private:
    PropertyList fontPickerReply(const AuditToken& token);
    void watchWebContentProcessConnection(const std::shared_ptr<Connection>& connection);
    void removeWebContentProcessConnection(const std::shared_ptr<Connection>& connection);

    std::atomic<bool> hasEnumerationEntitlement_ = false;
    std::atomic<bool> hasFontAccessEntitlement_ = false;
    std::atomic<bool> isFontProvider_ = false;

    mutable std::mutex mutex_;
    // Protected by mutex_.
    std::shared_ptr<Connection> clientConnection_;
    std::shared_ptr<TyphonServer> server_;
    // Null for most clients, which are many and idle.
    std::unique_ptr<const std::string> processIdentifier_;
    std::unique_ptr<std::vector<std::shared_ptr<Connection>>> webcontentProcessConnections_;
};

}  // namespace typhon
