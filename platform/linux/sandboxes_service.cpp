#include "platform/linux/sandboxes_service.h"

#include "platform/linux/bus_message.h"

#include <string>

#include <fcntl.h>

namespace typhon {

namespace {

const LinuxTransferredFile* fileOf(const Argument& argument)
{
    const auto* file = std::get_if<std::shared_ptr<TransferredFile>>(&argument);
    return file != nullptr ? dynamic_cast<const LinuxTransferredFile*>(file->get()) : nullptr;
}

/// Answers the calls of one connection. A connection may outlive the service by a moment.
class SandboxesObject : public ExportedObject {
public:
    explicit SandboxesObject(std::weak_ptr<SandboxesService> service) : service_(std::move(service)) {}

    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        answer(*call);
        co_return;
    }

private:
    void answer(IncomingCall& call)
    {
        const auto service = service_.lock();
        const auto* firstProcess = fileOf(call.arguments().at(0));
        const auto* executable = fileOf(call.arguments().at(1));
        if (!service || firstProcess == nullptr || executable == nullptr) {
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

    std::weak_ptr<SandboxesService> service_;
};

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
    shouldAcceptNewConnection->setExportedInterfaces(interfaces());
    shouldAcceptNewConnection->setExportedObject(std::make_shared<SandboxesObject>(weak_from_this()));
    shouldAcceptNewConnection->resume();
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
    auto listener = ipc.listenerForService(SandboxesService::serviceName);
    listener->setDelegate(service);
    listener->resume();
    return listener;
}

}  // namespace typhon
