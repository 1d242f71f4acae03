#pragma once

#include "platform/platform.h"
#include "platform/task.h"
#include "protocol/replies.h"
#include "registry/per_client_font_info.h"
#include "registry/user_font_registry.h"
#include "requests/font_name_resolution.h"
#include "requests/issued_paths_ledger.h"

#include <memory>
#include <string>

namespace typhon {

/// Hands the fonts that a user chose in the font picker to the application that the picker works for.
class FontPickerRequests {
public:
    /// What this builds on. Outlives it.
    struct Services {
        Platform& platform;
        UserFontRegistry& registry;
        PerClientFontInfo& perClientFontInfo;
        FontNameResolution& resolution;
        IssuedPathsLedger& ledger;
    };

    explicit FontPickerRequests(const Services& services) : services_(services) {}

    /// `requestFonts:forClient:reply:`. Connects to the application behind the endpoint and passes it the
    /// fonts of the PostScript name's family, enabled or not; the reply is the application's, or false. Each
    /// wait for the application ends with its connection or after 25 seconds. Runs on the picker's connection
    /// and holds it; who may call it is decided before. This object outlives the task.
    Task<void> requestFonts(std::string postScriptName, std::shared_ptr<ListenerEndpoint> forClient,
                            BooleanReply reply);

private:
    /// Sends the family's fonts to the client, if it may have any; true when the client's answer was passed
    /// on.
    Task<bool> offerFamily(std::shared_ptr<Connection> client, std::string familyName, BooleanReply reply);
    PropertyList fontsOfFamily(const AuditToken& client, const std::string& familyName);
    void record(const AuditToken& client, const PropertyList& fonts);

    const Services services_;
};

}  // namespace typhon
