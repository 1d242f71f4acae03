#include "platform/linux/identities_service.h"

#include "platform/linux/audit_tokens.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/pidfd.h"
#include "platform/linux/service_object.h"
#include "platform/linux/service_user.h"

#include <string>
#include <utility>

#include <unistd.h>

// A service that runs without privileges cannot look at the programs of other users, and only the daemon
// knows who lives in which sandbox. So it passes the process that called it, as a pidfd, and is told.

namespace typhon {

namespace {

constexpr const char* helperIdentifier = "com.vorlan.Typhon.UserFontManager";

void answer(IdentitiesService* service, IncomingCall& call)
{
    const auto* file = std::get_if<std::shared_ptr<TransferredFile>>(&call.arguments().at(0));
    const auto* process = file == nullptr ? nullptr : dynamic_cast<const LinuxTransferredFile*>(file->get());
    if (service == nullptr || process == nullptr) {
        call.fail({ipc_errors::invalidArguments, "identify takes a pidfd"});
        return;
    }
    auto outcome = service->identify(currentAuditToken(), process->descriptor.get());
    if (auto* error = std::get_if<IpcError>(&outcome)) {
        call.fail(std::move(*error));
    } else {
        Arguments results;
        results.emplace_back(std::get<PropertyList>(std::move(outcome)));
        call.reply(std::move(results));
    }
}

}  // namespace

bool IdentitiesService::mayAsk(const AuditToken& caller)
{
    if (caller.effectiveUser == ::geteuid() && runsAsServiceUser()) {
        return true;
    }
    if (sandbox_.isSandboxed(caller)) {
        return false;
    }
    if (caller.effectiveUser == 0 || caller.effectiveUser == ::geteuid()) {
        return true;
    }
    const auto task = codeSigning_.taskFromAuditToken(caller);
    return task && task->signingIdentifier == helperIdentifier;
}

std::variant<PropertyList, IpcError> IdentitiesService::identify(const AuditToken& caller, int process)
{
    if (!mayAsk(caller)) {
        TYLog_Error(log_,
                    "process " + std::to_string(caller.processIdentifier) + " may not ask who others are");
        return IpcError{ipc_errors::accessDenied, "only the system's services may ask who others are"};
    }
    const auto token = isPidfd(process) ? tokenOfProcess(process) : AuditToken{};
    const auto task = codeSigning_.taskFromAuditToken(token);
    if (!task) {
        return IpcError{ipc_errors::failed, "that process is gone or cannot be identified"};
    }
    PropertyList::Dictionary answer{{"sandboxed", sandbox_.isSandboxed(token)},
                                    {"user", std::int64_t(token.effectiveUser)},
                                    {"entitlements", task->entitlements}};
    if (task->signingIdentifier) {
        answer.emplace("identifier", *task->signingIdentifier);
    }
    return PropertyList(std::move(answer));
}

bool IdentitiesService::listener(Listener&, std::shared_ptr<Connection> shouldAcceptNewConnection)
{
    accept(*shouldAcceptNewConnection, weak_from_this(), answer);
    return true;
}

InterfaceDescriptions IdentitiesService::interfaces()
{
    static const auto descriptions = std::make_shared<const std::vector<InterfaceDescription>>(
        std::vector<InterfaceDescription>{{interfaceName, {{"identify", "h", "a{sv}", true}}}});
    return descriptions;
}

std::shared_ptr<Listener> startIdentitiesService(Ipc& ipc, const std::shared_ptr<IdentitiesService>& service)
{
    return startService(ipc, service);
}

}  // namespace typhon
