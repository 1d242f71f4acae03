#include "platform/linux/sandboxes_service.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/service_object.h"

#include <string>

#include <fcntl.h>

namespace typhon {

namespace {

const LinuxTransferredFile* fileOf(const Argument& argument)
{
    const auto* file = std::get_if<std::shared_ptr<TransferredFile>>(&argument);
    return file != nullptr ? dynamic_cast<const LinuxTransferredFile*>(file->get()) : nullptr;
}

void answer(SandboxesService* service, IncomingCall& call)
{
    const auto* firstProcess = fileOf(call.arguments().at(0));
    const auto* executable = fileOf(call.arguments().at(1));
    if (service == nullptr || firstProcess == nullptr || executable == nullptr) {
        call.fail({ipc_errors::invalidArguments, "register takes a pidfd and an executable"});
        return;
    }
    auto error = service->registerSandbox(currentAuditToken(), firstProcess->descriptor.get(),
                                          executable->descriptor.get());
    if (error) {
        call.fail(std::move(*error));
    } else {
        call.reply({});
    }
}

const char* errorNameOf(SandboxInstances::Refusal refusal)
{
    switch (refusal) {
    case SandboxInstances::Refusal::notAllowed:
        return ipc_errors::accessDenied;
    case SandboxInstances::Refusal::tooMany:
        return ipc_errors::limitsExceeded;
    case SandboxInstances::Refusal::alreadyRegistered:
        return ipc_errors::failed;
    case SandboxInstances::Refusal::invalid:
    case SandboxInstances::Refusal::none:
        break;
    }
    return ipc_errors::invalidArguments;
}

}  // namespace

std::optional<IpcError> SandboxesService::registerSandbox(const AuditToken& caller, int firstProcess,
                                                          int executable)
{
    FileDescriptor ownPidfd(::fcntl(firstProcess, F_DUPFD_CLOEXEC, 3));
    auto outcome = instances_.registerInstance(caller, std::move(ownPidfd), executable);
    if (outcome.refusal == SandboxInstances::Refusal::none) {
        return std::nullopt;
    }
    TYLog_Error(log_, "process " + std::to_string(caller.processIdentifier) +
                          " may not register a sandbox: " + outcome.explanation);
    return IpcError{errorNameOf(outcome.refusal), std::move(outcome.explanation)};
}

bool SandboxesService::listener(Listener&, std::shared_ptr<Connection> shouldAcceptNewConnection)
{
    accept(*shouldAcceptNewConnection, weak_from_this(), answer);
    return true;
}

InterfaceDescriptions SandboxesService::interfaces()
{
    static const auto descriptions = std::make_shared<const std::vector<InterfaceDescription>>(
        std::vector<InterfaceDescription>{{"com.vorlan.typhond.Sandboxes", {{"register", "hh", "", true}}}});
    return descriptions;
}

std::shared_ptr<Listener> startSandboxesService(Ipc& ipc, const std::shared_ptr<SandboxesService>& service)
{
    return startService(ipc, service);
}

}  // namespace typhon
