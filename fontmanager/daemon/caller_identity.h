#pragma once

#include "platform/audit_token.h"
#include "platform/code_signing.h"
#include "platform/ipc.h"
#include "platform/task.h"

#include <cstdint>
#include <optional>
#include <string>

namespace typhon {

/// Who a caller is, as far as that decides what it may do.
struct CallerIdentity {
    CodeSigningTask signature;
    bool isSandboxed = true;
    std::uint32_t user = 0;
};

/// Tells who callers are. Any thread.
class CallerIdentities {
public:
    struct Answer {
        std::optional<CallerIdentity> identity;
        /// Set when there is none.
        IpcError error;
    };
    virtual ~CallerIdentities() = default;
    /// Awaited on a work queue.
    virtual Task<Answer> identityOf(AuditToken caller) = 0;
};

/// True for an application that may install fonts: its entitlement "com.vorlan.developer.user-fonts" holds
/// "system-installation". It may touch the fonts of its own signing identifier.
bool isFontProvider(const CallerIdentity& caller);

/// What callers are measured against.
struct OwnUser {
    std::uint32_t user = 0;
    /// Nothing but the system's services runs as it; they are trusted also where the service manager confines
    /// them.
    bool isServiceUser = false;
};

/// True for the font daemon and administrators, who may touch everybody's fonts: outside of any sandbox, of
/// root or of the user that this process runs as, and not signed as an application.
bool isAdministrator(const CallerIdentity& caller, const OwnUser& own);

}  // namespace typhon
