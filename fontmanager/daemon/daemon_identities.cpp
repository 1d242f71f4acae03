#include "fontmanager/daemon/daemon_identities.h"

#include "fontmanager/daemon/peer_process.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/identities_service.h"

#include <chrono>
#include <string>
#include <utility>

namespace typhon {

namespace {

constexpr std::int64_t patience = std::chrono::nanoseconds(std::chrono::seconds(25)).count();

CallerIdentity identityFrom(const PropertyList& answer)
{
    CallerIdentity identity;
    if (const auto* identifier = answer.find("identifier"); identifier != nullptr && identifier->asString()) {
        identity.signature.signingIdentifier = *identifier->asString();
    }
    if (const auto* all = answer.find("entitlements"); all != nullptr && all->asDictionary()) {
        identity.signature.entitlements = *all->asDictionary();
    }
    const auto* sandboxed = answer.find("sandboxed");
    identity.isSandboxed = sandboxed == nullptr || sandboxed->asBoolean() == nullptr || sandboxed->isTrue();
    return identity;
}

CallerIdentities::Answer refusal(const char* name, std::string message)
{
    return {.identity = {}, .error = {name, std::move(message)}};
}

}  // namespace

DaemonIdentities::DaemonIdentities(Ipc& ipc)
    : daemon_(ipc.connectionToService(IdentitiesService::serviceName))
{
    daemon_->setRemoteObjectInterfaces(IdentitiesService::interfaces());
    daemon_->resume();
}

DaemonIdentities::~DaemonIdentities()
{
    daemon_->invalidate();
}

Task<CallerIdentities::Answer> DaemonIdentities::identityOf(AuditToken caller)
{
    auto pidfd = pidfdOfInstance(caller);
    if (!pidfd) {
        co_return refusal(ipc_errors::accessDenied, "the calling process is gone");
    }
    const std::shared_ptr<TransferredFile> process = std::make_shared<LinuxTransferredFile>(std::move(pidfd));
    Arguments arguments;
    arguments.emplace_back(process);
    Task<CallResult> asking =
        daemon_->callAndWait(IdentitiesService::interfaceName, "identify", std::move(arguments), patience);
    const CallResult result = co_await std::move(asking);
    if (!result.results) {
        co_return refusal(ipc_errors::accessDenied, "the font daemon cannot be asked who is calling (" +
                                                        result.error.message +
                                                        "); see to it that typhond runs, then try again");
    }
    const auto* answer = std::get_if<PropertyList>(&result.results->at(0));
    Answer known;
    known.identity = identityFrom(answer == nullptr ? PropertyList() : *answer);
    // The kernel says so, for this connection.
    known.identity->user = caller.effectiveUser;
    co_return known;
}

}  // namespace typhon
