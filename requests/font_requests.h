#pragma once

#include "platform/platform.h"
#include "platform/task.h"
#include "protocol/replies.h"
#include "requests/font_request.h"
#include "requests/request_counters.h"
#include "requests/request_gate.h"

#include <optional>

namespace typhon {

/// Answers applications that open documents with fonts they lack: admits those that are entitled to custom
/// fonts, one at a time, and hands each what is installed for it or what the user switches on.
class FontRequests {
public:
    /// What this builds on. Outlives it.
    struct Services {
        Platform& platform;
        WorkQueue& mainHandlerQueue;
        UserFontRegistry& registry;
        PerClientFontInfo& perClientFontInfo;
        FontNameResolution& resolution;
        IssuedPathsLedger& ledger;
        MissingFontsDialog& dialog;
    };

    explicit FontRequests(const Services& services);
    FontRequests(const FontRequests&) = delete;
    FontRequests& operator=(const FontRequests&) = delete;

    /// `requestFonts:reply:`. Runs on the calling connection's queue and holds it while other requests are
    /// before this one, and for a second after an answer that needs no dialog. A request whose client is gone
    /// takes its turn all the same. This object, and what it builds on, outlives the task.
    Task<void> requestFonts(PropertyList::Array requests, DictionaryReply reply);

    RequestCounters& counters() { return counters_; }
    const RequestGate& gate() const { return gate_; }

private:
    /// The current connection's process, if it is entitled to custom fonts.
    std::optional<FontRequester> admitted();
    Task<void> takeTurn(FontRequester requester, PropertyList::Array requests, DictionaryReply reply);

    Platform& platform_;
    WorkQueue& mainHandlerQueue_;
    RequestCounters counters_;
    RequestGate gate_;
    const FontRequestServices services_;
};

}  // namespace typhon
