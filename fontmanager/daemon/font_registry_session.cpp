#include "fontmanager/daemon/font_registry_session.h"

#include "fontmanager/directory_names.h"
#include "fontmanager/font_paths.h"
#include "fontmanager/font_registry_wire.h"
#include "platform/file_url.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/visible_text.h"

#include <array>
#include <string_view>
#include <utility>

// Who a caller is, is asked anew for every operation that names fonts; the files of a registration come under
// the permission with which it was begun. Reports go out around the write, so that the daemon neither reads a
// registry that is just being replaced nor serves one that was. A change and its reports are over before the
// next begins: reports that overtook each other would tell of fonts that are gone again as if they had come.

namespace typhon {

namespace {

using Call = std::shared_ptr<IncomingCall>;

const PropertyList& value(const Call& call, std::size_t index)
{
    return std::get<PropertyList>(call->arguments().at(index));
}

std::string text(const Call& call, std::size_t index)
{
    return *value(call, index).asString();
}

IpcError denied(std::string message)
{
    return {ipc_errors::accessDenied, std::move(message)};
}

IpcError nobodysFonts()
{
    return {ipc_errors::invalidArguments,
            "whose fonts? The calling program has no identifier of its own, so it has to give one"};
}

struct Paths {
    std::vector<std::string> paths;
    std::optional<IpcError> error;
};

/// The paths of file URLs.
Paths pathsOf(const PropertyList& urls)
{
    Paths result;
    for (const auto& url : stringsOf(urls)) {
        auto path = pathFromFileUrl(url);
        if (!path) {
            result.error = IpcError{ipc_errors::invalidArguments, visibleText(url, 300) + " is no file URL"};
            return result;
        }
        result.paths.push_back(std::move(*path));
    }
    return result;
}

void answerEmpty(const Call& call, const std::optional<std::string>& error)
{
    if (error) {
        call->fail({ipc_errors::failed, *error});
    } else {
        call->reply({});
    }
}

void answerCount(const Call& call, const RegistryChange& change)
{
    Arguments results;
    results.emplace_back(
        PropertyList(static_cast<std::int64_t>(change.available.size() + change.gone.size())));
    call->reply(std::move(results));
}

}  // namespace

FontRegistrySession::FontRegistrySession(std::shared_ptr<FontRegistryService> service)
    : service_(std::move(service))
{
    service_->connectionBegan();
}

FontRegistrySession::~FontRegistrySession()
{
    service_->connectionEnded();
}

Task<void> FontRegistrySession::handle(Self self, AuditToken caller, Call call)
{
    using Handler = Task<void> (*)(Self, AuditToken, Call);
    struct Row {
        const char* member;
        Handler handler;
    };
    static constexpr std::array table{
        Row{font_registry_wire::beginRegistration.member, beginRegistration},
        Row{font_registry_wire::addFontFile.member, addFontFile},
        Row{font_registry_wire::commitRegistration.member, commitRegistration},
        Row{font_registry_wire::cancelRegistration.member, cancelRegistration},
        Row{font_registry_wire::unregister.member, unregister},
        Row{font_registry_wire::unregisterAll.member, unregisterAll},
        Row{font_registry_wire::enableOrDisable.member, enableOrDisable},
        Row{font_registry_wire::synchronizeFontProviders.member, synchronizeFontProviders},
        Row{font_registry_wire::synchronizeProfileFonts.member, synchronizeProfileFonts},
        Row{font_registry_wire::synchronizeFontAssets.member, synchronizeFontAssets},
    };
    for (const auto& row : table) {
        if (call->member() == row.member) {
            return row.handler(std::move(self), caller, std::move(call));
        }
    }
    abort();
}

bool FontRegistrySession::Permission::coversFile(const std::string& path) const
{
    const auto place = font_paths::placeOfFontFile(path);
    const auto provider = place ? identifierFromDirectoryName(place->directory) : std::nullopt;
    return everybody || (provider && provider == identifier);
}

Task<FontRegistrySession::Permission> FontRegistrySession::permissionOf(Self self, AuditToken caller)
{
    Task<CallerIdentities::Answer> asking = self->service_->parts().identities.identityOf(caller);
    const auto answer = co_await std::move(asking);
    Permission permission;
    if (!answer.identity) {
        permission.error = answer.error;
    } else if (isAdministrator(*answer.identity, self->service_->own())) {
        permission.everybody = true;
        permission.identifier = answer.identity->signature.signingIdentifier.value_or("");
    } else if (isFontProvider(*answer.identity)) {
        permission.identifier = *answer.identity->signature.signingIdentifier;
    } else {
        TYLog_Error(self->service_->parts().log,
                    "process " + std::to_string(caller.processIdentifier) + " may not change fonts");
        permission.error = denied("fonts are changed by font providers (signed, with \"system-installation\" "
                                  "in com.vorlan.developer.user-fonts) and by administrators");
    }
    co_return permission;
}

Task<bool> FontRegistrySession::mayChangeEverything(Self self, AuditToken caller, Call call)
{
    Task<Permission> asking = permissionOf(self, caller);
    const auto permission = co_await std::move(asking);
    const bool isAllowed = !permission.error && permission.everybody;
    if (!isAllowed) {
        call->fail(permission.error.value_or(denied("that is for the daemon and administrators")));
    }
    co_return isAllowed;
}

Task<void> FontRegistrySession::beginRegistration(Self self, AuditToken caller, Call call)
{
    if (self->registration_) {
        call->fail({ipc_errors::failed, "a registration is under way on this connection already"});
        co_return;
    }
    Task<Permission> asking = permissionOf(self, caller);
    const auto permission = co_await std::move(asking);
    const auto identifier = permission.meant(text(call, 0));
    if (permission.error || !permission.covers(identifier)) {
        call->fail(permission.error.value_or(denied("a font provider installs fonts for itself only")));
        co_return;
    }
    if (identifier.empty()) {
        call->fail(nobodysFonts());
        co_return;
    }
    auto beginning = self->service_->parts().store.begin(identifier, value(call, 1).isTrue());
    if (!beginning.registration) {
        call->fail({ipc_errors::failed, *beginning.error});
        co_return;
    }
    self->registration_ = std::move(beginning.registration);
    call->reply({});
}

Task<void> FontRegistrySession::addFontFile(Self self, AuditToken /*caller*/, Call call)
{
    const auto* argument = std::get_if<std::shared_ptr<TransferredFile>>(&call->arguments().at(0));
    const auto* file = dynamic_cast<const LinuxTransferredFile*>(argument->get());
    if (!self->registration_ || file == nullptr) {
        call->fail({ipc_errors::failed, "no registration is under way on this connection"});
        co_return;
    }
    if (auto error = self->registration_->add(text(call, 1), file->descriptor.get())) {
        self->registration_.reset();
        call->fail({ipc_errors::failed, std::move(*error)});
        co_return;
    }
    Arguments results;
    results.emplace_back(PropertyList(static_cast<std::int64_t>(self->registration_->fonts().size())));
    call->reply(std::move(results));
}

Task<void> FontRegistrySession::commitRegistration(Self self, AuditToken /*caller*/, Call call)
{
    if (!self->registration_) {
        call->fail({ipc_errors::failed, "no registration is under way on this connection"});
        co_return;
    }
    // Whoever passed slow files keeps nobody waiting with them but itself.
    if (auto error = self->registration_->finish()) {
        self->registration_.reset();
        call->fail({ipc_errors::failed, std::move(*error)});
        co_return;
    }
    std::vector<std::string> paths;
    for (const auto& staged : self->registration_->fonts()) {
        paths.push_back(staged.font.path);
    }
    std::function<RegistryChangeOutcome(FontStore&)> work = [self](FontStore& store) {
        auto& registration = *self->registration_;
        return registration.fonts().empty() ? RegistryChangeOutcome{} : store.commit(registration);
    };
    Task<RegistryChangeOutcome> changing = changeInTurn(self, std::move(work));
    const auto outcome = co_await std::move(changing);
    // Whoever is answered finds no copies any more.
    self->registration_.reset();
    if (outcome.error) {
        call->fail({ipc_errors::failed, *outcome.error});
        co_return;
    }
    Arguments results;
    results.emplace_back(arrayOfStrings(paths));
    call->reply(std::move(results));
}

Task<void> FontRegistrySession::cancelRegistration(Self self, AuditToken /*caller*/, Call call)
{
    self->registration_.reset();
    call->reply({});
    co_return;
}

Task<void> FontRegistrySession::unregister(Self self, AuditToken caller, Call call)
{
    Task<Permission> asking = permissionOf(self, caller);
    const auto permission = co_await std::move(asking);
    auto [paths, error] = pathsOf(value(call, 0));
    for (const auto& path : paths) {
        if (!permission.coversFile(path) && !error) {
            error = denied(visibleText(path, 300) + " is not a font file of the caller's");
        }
    }
    if (permission.error || error) {
        call->fail(permission.error ? *permission.error : *error);
        co_return;
    }
    std::function<RegistryChangeOutcome(FontStore&)> work = [paths = std::move(paths)](FontStore& store) {
        return store.unregister(paths);
    };
    Task<void> changing = changeAndAnswer(self, call, std::move(work));
    co_await std::move(changing);
}

Task<void> FontRegistrySession::unregisterAll(Self self, AuditToken caller, Call call)
{
    Task<Permission> asking = permissionOf(self, caller);
    const auto permission = co_await std::move(asking);
    const auto identifier = permission.meant(text(call, 0));
    if (permission.error || !permission.covers(identifier)) {
        call->fail(permission.error.value_or(denied("a font provider removes its own fonts only")));
        co_return;
    }
    if (identifier.empty()) {
        call->fail(nobodysFonts());
        co_return;
    }
    std::function<RegistryChangeOutcome(FontStore&)> work = [identifier](FontStore& store) {
        return store.unregisterAll(identifier);
    };
    Task<void> changing = changeAndAnswer(self, call, std::move(work));
    co_await std::move(changing);
}

Task<void> FontRegistrySession::enableOrDisable(Self self, AuditToken caller, Call call)
{
    Task<Permission> asking = permissionOf(self, caller);
    const auto permission = co_await std::move(asking);
    auto [paths, error] = pathsOf(value(call, 0));
    for (const auto& path : paths) {
        if (!permission.coversFile(path) && !error) {
            error = denied(visibleText(path, 300) + " is not a font file of the caller's");
        }
    }
    if (permission.error || error) {
        call->fail(permission.error ? *permission.error : *error);
        co_return;
    }
    const bool enabled = value(call, 1).isTrue();
    std::function<RegistryChangeOutcome(FontStore&)> work =
        [paths = std::move(paths), enabled](FontStore& store) { return store.setEnabled(paths, enabled); };
    Task<void> changing = changeAndAnswer(self, call, std::move(work));
    co_await std::move(changing);
}

Task<void> FontRegistrySession::synchronizeFontProviders(Self self, AuditToken caller, Call call)
{
    Task<bool> asking = mayChangeEverything(self, caller, call);
    const bool isAllowed = co_await std::move(asking);
    if (!isAllowed) {
        co_return;
    }
    std::function<RegistryChangeOutcome(FontStore&)> work = [](FontStore& store) {
        return store.synchronizeProviders();
    };
    Task<RegistryChangeOutcome> changing = changeInTurn(self, std::move(work));
    const auto outcome = co_await std::move(changing);
    answerEmpty(call, outcome.error);
}

Task<void> FontRegistrySession::synchronizeProfileFonts(Self self, AuditToken caller, Call call)
{
    Task<bool> asking = mayChangeEverything(self, caller, call);
    const bool isAllowed = co_await std::move(asking);
    if (!isAllowed) {
        co_return;
    }
    const auto& parts = self->service_->parts();
    auto outcome = parts.profileFonts.synchronize();
    Task<void> reporting = parts.reports.report(std::move(outcome.change), ChangeReports::Kind::profileFonts);
    co_await std::move(reporting);
    answerEmpty(call, outcome.error);
}

Task<void> FontRegistrySession::synchronizeFontAssets(Self self, AuditToken caller, Call call)
{
    Task<bool> asking = mayChangeEverything(self, caller, call);
    const bool isAllowed = co_await std::move(asking);
    if (!isAllowed) {
        co_return;
    }
    // Reads any number of fonts, and nobody else changes those.
    std::function<RegistryChangeOutcome(FontStore&)> work =
        [&fontAssets = self->service_->parts().fontAssets](FontStore&) { return fontAssets.synchronize(); };
    Task<RegistryChangeOutcome> changing = change(self, std::move(work));
    const auto outcome = co_await std::move(changing);
    answerEmpty(call, outcome.error);
}

Task<RegistryChangeOutcome> FontRegistrySession::change(Self self,
                                                        std::function<RegistryChangeOutcome(FontStore&)> work)
{
    const auto& parts = self->service_->parts();
    Task<void> announcing = parts.reports.announce();
    co_await std::move(announcing);
    parts.store.changeBegins();
    auto outcome = work(parts.store);
    if (outcome.error) {
        TYLog_Error(parts.log, "fonts were not changed: " + *outcome.error);
    }
    Task<void> reporting = parts.reports.report(outcome.change, ChangeReports::Kind::userFonts);
    co_await std::move(reporting);
    parts.store.changeWasReported();
    co_return outcome;
}

Task<RegistryChangeOutcome>
FontRegistrySession::changeInTurn(Self self, std::function<RegistryChangeOutcome(FontStore&)> work)
{
    auto& turns = self->service_->parts().changes;
    Task<RegistryChangeOutcome> changing = change(self, std::move(work));
    Task<RegistryChangeOutcome> inTurn = turns.perform(std::move(changing));
    co_return co_await std::move(inTurn);
}

Task<void> FontRegistrySession::changeAndAnswer(Self self, Call call,
                                                std::function<RegistryChangeOutcome(FontStore&)> work)
{
    Task<RegistryChangeOutcome> changing = changeInTurn(self, std::move(work));
    const auto outcome = co_await std::move(changing);
    if (outcome.error) {
        call->fail({ipc_errors::failed, *outcome.error});
    } else {
        answerCount(call, outcome.change);
    }
}

}  // namespace typhon
