#pragma once

#include "platform/platform.h"
#include "platform/task.h"
#include "registry/entry_sharing.h"
#include "registry/user_font_registry.h"

#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// Cuts the registry down to what one client may see, and issues the extensions with which it may read the
/// files. Runs on `mainHandlerQueue`, where `setupUserInstalledFontsFor` takes itself; the others are called
/// there, though nothing breaks elsewhere.
class PerClientFontInfo {
public:
    /// What the per-client view needs from rooms above it. Any thread.
    struct Needs {
        /// `isAuditTokenSandboxed:`
        std::function<bool(const AuditToken&)> isAuditTokenSandboxed;
        /// `issuedFontFilePathsForIdentifier:`
        std::function<std::vector<std::string>(const std::string&)> issuedFontFilePathsForIdentifier;
    };

    /// Whether to include an entry. May set `noGrant`: the client then gets the entry without an extension.
    using Filter = std::function<bool(const std::string& path, const PropertyList& entry, bool& noGrant)>;
    using Reply = std::function<void(std::optional<PropertyList>)>;

    /// Everything given outlives this.
    PerClientFontInfo(Platform& platform, UserFontRegistry& registry, WorkQueue& mainHandlerQueue,
                      Needs needs);

    /// `filterUserFontInfoForAuditToken:withEnumerationCapability:withFilter:`. The entries that pass the
    /// filter, by path, as the client may have them. Walks the whole registry.
    PropertyList filterUserFontInfoForAuditToken(const AuditToken& token, bool withEnumerationCapability,
                                                 const Filter& withFilter);
    /// The same for a filter that admits nothing outside of `among`, which are entries of the registry: walks
    /// only them.
    PropertyList filterUserFontInfoForAuditToken(const AuditToken& token, bool withEnumerationCapability,
                                                 const Filter& withFilter,
                                                 const std::vector<const RegistrySnapshot::Entry*>& among);

    /// `fontInfoForAuditToken:withEnumuration:installation:identifier:andFileFilters:foundFontDirectoryName:`.
    /// The enabled entries that a client of these capabilities sees, only those of the allowed paths if such
    /// are given. `foundFontDirectoryName`, if given, receives the provider's directory name when one of the
    /// provider's own fonts is among them. An enumerating client without allowed paths gets the one value
    /// that all of them share.
    PropertyList fontInfoForAuditToken(const AuditToken& token, bool withEnumuration, bool installation,
                                       const std::optional<std::string>& identifier,
                                       const std::optional<std::set<std::string>>& andFileFilters,
                                       std::optional<std::string>* foundFontDirectoryName);

    /// `sandboxExtensionForEnumeration:`. For the directory of all font files, whether needed or not. As for
    /// the two below: the token's text with its terminating zero byte, or null.
    std::optional<PropertyList> sandboxExtensionForEnumeration(const AuditToken& token);
    /// `sandboxExtensionForFontAssets:`. For the font-asset directory; null also when the client can read it.
    std::optional<PropertyList> sandboxExtensionForFontAssets(const AuditToken& token);
    /// `sandboxExtensionForProvider:withDirectoryName:`. For a provider's directory; null also when the
    /// client can read it.
    std::optional<PropertyList> sandboxExtensionForProvider(const AuditToken& token,
                                                            const std::string& withDirectoryName);

    /// `setupUserInstalledFontsFor:withCapabilitiesFor:hasEnumeration:hasFontAccess:isFontProvider:
    /// processIdentifier:reply:`. Answers a check-in: with null at once for a client without capabilities,
    /// else with its fonts and extensions, on `mainHandlerQueue`, for which the caller is suspended. The
    /// second token says whose capabilities these are, and decides nothing.
    Task<void> setupUserInstalledFontsFor(AuditToken token, AuditToken withCapabilitiesFor,
                                          bool hasEnumeration, bool hasFontAccess, bool isFontProvider,
                                          std::optional<std::string> processIdentifier, Reply reply);

private:
    struct Client {
        AuditToken token;
        bool hasEnumeration = false;
        bool hasFontAccess = false;
        bool isFontProvider = false;
        std::optional<std::string> identifier;
    };

    EntrySharing sharingWith(const AuditToken& token, bool hasEnumeration);
    PropertyList checkinReply(const Client& client);
    PropertyList issuedFontInfo(const AuditToken& token, const std::string& identifier);
    PropertyList visibleFonts(const Client& client, std::optional<std::string>& foundDirectoryName);
    std::optional<PropertyList> extension(const AuditToken& token, const std::string& path);
    std::optional<PropertyList> extensionIfNeeded(const AuditToken& token, const std::string& path);

    Platform& platform_;
    UserFontRegistry& registry_;
    WorkQueue& mainHandlerQueue_;
    Needs needs_;
};

}  // namespace typhon
