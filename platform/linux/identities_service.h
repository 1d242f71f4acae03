#pragma once

#include "platform/code_signing.h"
#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/sandbox.h"

#include <memory>
#include <variant>

namespace typhon {

/// Tells the system's other services who their callers are, at the service "com.vorlan.typhond.identities".
/// It answers processes outside of any sandbox only: the daemon's own user's, root's, and the helper of the
/// font registry by its signature. Any thread.
class IdentitiesService : public ListenerDelegate, public std::enable_shared_from_this<IdentitiesService> {
public:
    static constexpr const char* serviceName = "com.vorlan.typhond.identities";
    static constexpr const char* interfaceName = "com.vorlan.typhond.Identities";

    /// All of them outlive this.
    IdentitiesService(CodeSigning& codeSigning, Sandbox& sandbox, Log& log)
        : codeSigning_(codeSigning), sandbox_(sandbox), log_(log)
    {}

    /// What the service's "identify" does: "sandboxed" (boolean), "user" (integer) and, of a signed program,
    /// "identifier" (string) and "entitlements" (dictionary) of the process behind `process`, a pidfd.
    std::variant<PropertyList, IpcError> identify(const AuditToken& caller, int process);

    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override;

    /// What the service exports.
    static InterfaceDescriptions interfaces();

private:
    bool mayAsk(const AuditToken& caller);

    CodeSigning& codeSigning_;
    Sandbox& sandbox_;
    Log& log_;
};

/// Opens the service: a resumed listener that asks `service`, which stays alive as long as somebody holds it.
std::shared_ptr<Listener> startIdentitiesService(Ipc& ipc, const std::shared_ptr<IdentitiesService>& service);

}  // namespace typhon
