#pragma once

#include "clients/font_change_broadcast.h"
#include "clients/notification_center.h"
#include "platform/audit_token.h"
#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/work_queue.h"
#include "protocol/typhon_daemon_protocol.h"
#include "registry/per_client_font_info.h"

#include <optional>
#include <string>

namespace typhon {

/// What a client may do with user-installed fonts, and who it is.
struct Capabilities {
    /// May list all of them.
    bool allowEnumerate = false;
    /// May use those that were issued to it.
    bool allowUserFonts = false;
    /// May install fonts, and use its own.
    bool allowInstallation = false;
    /// The signing identifier.
    std::optional<std::string> identifier;
};

/// The daemon as a client's handler knows it: the operations that the handler passes on, and what it needs
/// to answer the others itself. Any thread.
class TyphonServer : public TyphonDaemonProtocol {
public:
    /// `capabilitiesFor:allowEnumerate:allowUserFonts:allowInstallation:andIdentifier:`
    virtual Capabilities capabilitiesFor(const AuditToken& token) = 0;
    /// `isCurrentConnectionFontPicker`
    virtual bool isCurrentConnectionFontPicker() = 0;

    virtual PerClientFontInfo& perClientFontInfo() = 0;
    virtual NotificationCenter& notificationCenter() = 0;
    virtual FontChangeBroadcast& fontChangeBroadcast() = 0;
    virtual WorkQueue& mainHandlerQueue() = 0;
    virtual Ipc& ipc() = 0;
    /// Outlives everything.
    virtual Log& log() = 0;
};

}  // namespace typhon
