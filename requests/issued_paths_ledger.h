#pragma once

#include "platform/code_signing.h"
#include "platform/preferences.h"
#include "platform/task.h"
#include "protocol/replies.h"
#include "registry/user_font_registry.h"

#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// Which font files were handed to which application, in the preference "issues": application identifier to
/// array of paths, the two user-font directories shortened to "U/" and "A/". Any thread; writing blocks on
/// the disk, pruning may have to load the registry.
class IssuedPathsLedger {
public:
    /// Everything given outlives this.
    IssuedPathsLedger(Preferences& preferences, CodeSigning& codeSigning, UserFontRegistry& registry)
        : preferences_(preferences), codeSigning_(codeSigning), registry_(registry)
    {}

    /// `sanitizeIssuedFontPaths:`. The paths that the registry holds, in their stored form, each once.
    std::vector<std::string> sanitizeIssuedFontPaths(const std::vector<std::string>& paths);

    /// `recordIssuedFontPaths:forIdentifier:`. Adds paths to an application's record and drops those of it
    /// that are no longer installed; writes only when the record changes. Nothing without an identifier.
    void recordIssuedFontPaths(std::vector<std::string> paths,
                               const std::optional<std::string>& forIdentifier);

    /// `issuedFontFilePathsForIdentifier:`. The absolute paths recorded for an application, installed or not.
    std::vector<std::string> issuedFontFilePathsForIdentifier(const std::string& identifier);

    /// `forgetClientApplication:`. Drops an application's record. Nothing without an identifier.
    void forgetClientApplication(const std::optional<std::string>& identifier);

    /// `resetIssuedFontsFor:reply:`. The same on behalf of the current connection's process, if that is
    /// entitled to it; answers in any case, without saying which it was.
    Task<void> resetIssuedFontsFor(std::string identifier, EmptyReply reply);

private:
    bool isCallerEntitledToReset();
    void store(PropertyList::Dictionary issues);

    Preferences& preferences_;
    CodeSigning& codeSigning_;
    UserFontRegistry& registry_;
    /// Held from reading the record to having written it.
    std::mutex writing_;
};

}  // namespace typhon
