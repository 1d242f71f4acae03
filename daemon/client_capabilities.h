#pragma once

#include "clients/typhon_server.h"
#include "platform/platform.h"
#include "platform/property_list.h"

#include <mutex>
#include <optional>
#include <string>

namespace typhon {

/// Decides what a process may do, from its code signature, its sandbox and the font-access privacy list.
/// Whatever cannot be found out is not granted. Any thread.
class ClientCapabilities {
public:
    /// `platform` outlives this.
    explicit ClientCapabilities(Platform& platform) : platform_(platform) {}

    /// `capabilitiesFor:allowEnumerate:allowUserFonts:allowInstallation:andIdentifier:`
    Capabilities capabilitiesFor(const AuditToken& token);

    /// `isIdentifierAllowedForFontEnumeration:`. False when the privacy list bars the installed version of
    /// that application, which is logged.
    bool isIdentifierAllowedForFontEnumeration(const std::string& identifier);

    /// `isAuditTokenSandboxed:`
    bool isAuditTokenSandboxed(const AuditToken& token) { return platform_.sandbox.isSandboxed(token); }

    /// `isCurrentConnectionFontPicker`. Judged by the connection whose message is being handled; false when
    /// there is none.
    bool isCurrentConnectionFontPicker();

    /// The privacy list `fontEnumerationProhibitedInfo`: an array of dictionaries from bundle identifier to
    /// an array of barred short version strings. Null, as at first, bars nobody.
    std::optional<PropertyList> fontEnumerationProhibitedInfo() const;
    void setFontEnumerationProhibitedInfo(std::optional<PropertyList> list);

private:
    bool isBarredBy(const PropertyList& prohibitions, const std::string& identifier);

    Platform& platform_;
    mutable std::mutex mutex_;
    // Protected by mutex_.
    std::optional<PropertyList> fontEnumerationProhibitedInfo_;
};

}  // namespace typhon
