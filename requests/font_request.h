#pragma once

#include "platform/platform.h"
#include "protocol/replies.h"
#include "registry/per_client_font_info.h"
#include "registry/user_font_registry.h"
#include "requests/font_name_resolution.h"
#include "requests/issued_paths_ledger.h"
#include "requests/missing_fonts_dialog.h"
#include "requests/request_counters.h"
#include "requests/request_gate.h"

#include <atomic>
#include <memory>
#include <string>
#include <vector>

namespace typhon {

/// What font requests stand on. Outlives them.
struct FontRequestServices {
    Platform& platform;
    UserFontRegistry& registry;
    PerClientFontInfo& perClientFontInfo;
    FontNameResolution& resolution;
    IssuedPathsLedger& ledger;
    MissingFontsDialog& dialog;
    RequestCounters& counters;
    RequestGate& gate;
};

/// Who made a request, as found when it was admitted.
struct FontRequester {
    AuditToken token;
    std::string signingIdentifier;
    bool hasEnumeration = false;
};

/// One admitted request that has passed the gate, until it is answered and its turn is over. Held by the work
/// on it and by the dialog that it waits for.
class FontRequest {
public:
    FontRequest(const FontRequestServices& services, FontRequester requester, DictionaryReply reply);

    /// Answers the request for those names, or has the user asked. On `mainHandlerQueue`. The request's turn
    /// ends in here, unless a dialog is up.
    static Task<void> resolve(std::shared_ptr<FontRequest> request, PropertyList::Array requests);

    /// The completion step: ends the request's turn. Acts once.
    static Task<void> complete(std::shared_ptr<FontRequest> request);

private:
    /// What the user's answers add to the reply.
    struct Chosen {
        PropertyList fontInfo;
        /// File URLs of the fonts to be switched on.
        std::vector<std::string> urls;
    };

    Task<void> askUser(std::shared_ptr<FontRequest> self, PlacedFontNames names);
    /// The answer handler. A second answer is dealt with like the first, but for the reply and the turn.
    static Task<void> finish(std::shared_ptr<FontRequest> request, PropertyList::Array answers);
    Task<void> handOut(PropertyList::Array answers);
    PropertyList enabledFonts(const std::vector<std::string>& familyNames);
    Chosen chosenFonts(const PropertyList::Array& answers);
    Task<void> switchOn(std::vector<std::string> urls);
    void answer(const PropertyList& fonts);
    void record(const PropertyList& fonts);

    const FontRequestServices services_;
    const FontRequester requester_;
    const DictionaryReply reply_;
    /// The fonts that are there already. Written before any dialog is up.
    PropertyList fontInfo_;
    std::atomic<bool> isAnswered_ = false;
    std::atomic<bool> isComplete_ = false;
};

}  // namespace typhon
