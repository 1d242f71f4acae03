#pragma once

#include "platform/ipc.h"
#include "platform/linux/sandbox_instances.h"
#include "platform/log.h"

#include <memory>

namespace typhon {

/// Takes the registrations of sandboxes, at the service "com.vorlan.typhond.sandboxes". Any thread.
class SandboxesService : public ListenerDelegate, public std::enable_shared_from_this<SandboxesService> {
public:
    static constexpr const char* serviceName = "com.vorlan.typhond.sandboxes";

    /// Both outlive this.
    SandboxesService(SandboxInstances& instances, Log& log) : instances_(instances), log_(log) {}

    /// What the service's "register" does. Null on success.
    std::optional<IpcError> registerSandbox(const AuditToken& caller, int firstProcess, int executable);

    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override;

    /// What the service exports.
    static InterfaceDescriptions interfaces();

private:
    SandboxInstances& instances_;
    Log& log_;
};

/// Opens the service: a resumed listener that asks `service`, which stays alive as long as somebody holds it.
std::shared_ptr<Listener> startSandboxesService(Ipc& ipc, const std::shared_ptr<SandboxesService>& service);

}  // namespace typhon
