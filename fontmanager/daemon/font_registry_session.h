#pragma once

#include "fontmanager/daemon/font_registry_service.h"
#include "fontmanager/font_registration.h"
#include "platform/ipc.h"

#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// One connection to the service: what its caller asks for, whether the caller may, and the registration that
/// it has under way. Used by one item of the connection's queue at a time.
class FontRegistrySession : public std::enable_shared_from_this<FontRegistrySession> {
public:
    explicit FontRegistrySession(std::shared_ptr<FontRegistryService> service);
    FontRegistrySession(const FontRegistrySession&) = delete;
    FontRegistrySession& operator=(const FontRegistrySession&) = delete;
    ~FontRegistrySession();

    using Self = std::shared_ptr<FontRegistrySession>;
    using Call = std::shared_ptr<IncomingCall>;

    /// Handles and answers one call.
    static Task<void> handle(Self self, AuditToken caller, Call call);

private:
    /// What a caller was asked about, and what it may.
    struct Permission {
        /// Whose fonts the caller may touch: everybody's, or those of `identifier`.
        bool everybody = false;
        std::string identifier;
        std::optional<IpcError> error;

        /// Whose fonts a call is about: empty in the call means the caller's own.
        std::string meant(std::string provider) const { return provider.empty() ? identifier : provider; }
        bool covers(const std::string& provider) const { return everybody || identifier == provider; }
        bool coversFile(const std::string& path) const;
    };
    static Task<Permission> permissionOf(Self self, AuditToken caller);
    /// Whether the caller is the daemon or an administrator; if not, the call has failed.
    static Task<bool> mayChangeEverything(Self self, AuditToken caller, Call call);

    static Task<void> beginRegistration(Self self, AuditToken caller, Call call);
    static Task<void> addFontFile(Self self, AuditToken caller, Call call);
    static Task<void> commitRegistration(Self self, AuditToken caller, Call call);
    static Task<void> cancelRegistration(Self self, AuditToken caller, Call call);
    static Task<void> unregister(Self self, AuditToken caller, Call call);
    static Task<void> unregisterAll(Self self, AuditToken caller, Call call);
    static Task<void> enableOrDisable(Self self, AuditToken caller, Call call);
    static Task<void> synchronizeFontProviders(Self self, AuditToken caller, Call call);
    static Task<void> synchronizeProfileFonts(Self self, AuditToken caller, Call call);
    static Task<void> synchronizeFontAssets(Self self, AuditToken caller, Call call);

    /// Changes the fonts, with the reports before and after it, and tells how it went.
    static Task<RegistryChangeOutcome> change(Self self,
                                              std::function<RegistryChangeOutcome(FontStore&)> work);
    /// The same when no other change is under way.
    static Task<RegistryChangeOutcome> changeInTurn(Self self,
                                                    std::function<RegistryChangeOutcome(FontStore&)> work);
    static Task<void> changeAndAnswer(Self self, Call call,
                                      std::function<RegistryChangeOutcome(FontStore&)> work);

    const std::shared_ptr<FontRegistryService> service_;
    std::unique_ptr<FontRegistration> registration_;
};

}  // namespace typhon
