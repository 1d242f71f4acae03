#pragma once

#include "clients/font_change.h"
#include "platform/audit_token.h"
#include "platform/ipc.h"
#include "platform/platform.h"
#include "registry/per_client_font_info.h"

#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// The share that each client has in one change of fonts. What is the same for many clients is computed once
/// and shared by all their messages. Used on `mainHandlerQueue`, and for no longer than one broadcast.
class FontChangeShares {
public:
    /// Who is to be told, as far as that decides what.
    struct Recipient {
        /// All zero when the connection is gone.
        AuditToken token;
        bool hasEnumeration = false;
        bool isFontProvider = false;
        /// A provider's signing identifier.
        std::optional<std::string> identifier;
    };

    /// Everything given outlives this.
    FontChangeShares(Platform& platform, PerClientFontInfo& fontInfo, const PropertyList& description);

    /// The arguments of `fontAddedInfo:addedURLStrings:removedURLStrings:` for that client, or null when the
    /// change does not concern it.
    std::optional<Arguments> shareOf(const Recipient& recipient);

private:
    using Fonts = std::vector<const FontChange::Font*>;

    std::optional<Arguments> shareInUserFonts(const Recipient& recipient);
    const Arguments& addedToEnumerating(const Recipient& recipient);
    std::optional<Arguments> addedToProvider(const Recipient& recipient);
    Arguments addedUserFonts(const Recipient& recipient, const Fonts& fonts);
    const Arguments& changedProfileFonts();
    PropertyList profileFonts() const;
    const Fonts& fontsInUserDirectories();

    Platform& platform_;
    PerClientFontInfo& fontInfo_;
    const FontChange change_;
    const Fonts all_;
    /// Each computed when first needed.
    std::optional<Fonts> inUserDirectories_;
    std::optional<Arguments> forEnumerating_;
    std::optional<Arguments> removed_;
    std::optional<Arguments> ofProfileFonts_;
};

}  // namespace typhon
