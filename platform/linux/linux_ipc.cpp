#include "platform/linux/linux_ipc.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/linux_connection.h"
#include "platform/linux/linux_listener.h"
#include "platform/linux/listening_sockets.h"
#include "platform/linux/unix_sockets.h"

#include <utility>

namespace typhon {

namespace {

BusLink::Role endpointRole(const IpcContext& context)
{
    return context.endpointHandshake == EndpointHandshake::server ? BusLink::Role::server
                                                                  : BusLink::Role::client;
}

/// Whoever hands over an endpoint must not make us speak to a service of somebody else, and one whose maker
/// is gone leads to nobody that could be identified.
std::string objectionTo(const AuditToken& peer, const std::optional<AuditToken>& sender)
{
    if (peer == AuditToken{}) {
        return "the process behind the endpoint cannot be identified";
    }
    if (sender && (*sender == AuditToken{} || sender->effectiveUser != peer.effectiveUser)) {
        return "the endpoint belongs to another user than its sender";
    }
    return {};
}

ConnectedSocket connectToEndpoint(IpcContext& context, const std::shared_ptr<ListenerEndpoint>& endpoint)
{
    const auto role = endpointRole(context);
    const auto* file = dynamic_cast<const LinuxTransferredFile*>(endpoint.get());
    if (file == nullptr) {
        return {{}, {}, role, "there is no endpoint"};
    }
    auto connected = connectToDescriptor(file->descriptor.get());
    if (!connected.socket) {
        return {{}, {}, role, connected.problem};
    }
    const auto peer = context.identifyPeer(connected.socket.get());
    auto objection = objectionTo(peer, file->sender);
    if (!objection.empty()) {
        return {{}, {}, role, std::move(objection)};
    }
    auto admission = context.accounting->admit(peer);
    if (!admission.refusal.empty()) {
        context.offenders.report(peer, "connections", admission.refusal);
    }
    if (!admission.charge) {
        return {{}, {}, role, "its process has too many connections"};
    }
    return {std::move(connected.socket), peer, role, {}, std::move(admission.charge)};
}

ConnectedSocket connectToService(const IpcContext& context, const std::string& name)
{
    auto connected = connectToPath(pathOfService(context.root, name));
    const auto peer = connected.socket ? context.identifyPeer(connected.socket.get()) : AuditToken{};
    return {std::move(connected.socket), peer, BusLink::Role::client, name + ": " + connected.problem};
}

std::shared_ptr<IpcContext> makeContext(EventPool& pool, WorkQueues& queues, Log& log, RootDirectory root,
                                        IdentifyPeer identifyPeer, IpcLimits limits,
                                        EndpointHandshake handshake)
{
    auto accounting =
        std::make_shared<ConnectionAccounting>(limits.connectionsPerProcess, limits.connectionsPerUser);
    auto deadlines = queues.createSerialQueue("com.vorlan.typhond.deadlines");
    auto memoryReturn = std::make_shared<MemoryReturn>(queues, deadlines, limits.memoryReturn);
    // Not an aggregate that could be made in place: it holds a mutex.
    // NOLINTNEXTLINE(modernize-make-shared)
    return std::shared_ptr<IpcContext>(
        new IpcContext{pool,
                       queues,
                       log,
                       std::move(root),
                       std::move(identifyPeer),
                       limits,
                       handshake,
                       std::move(deadlines),
                       std::move(accounting),
                       std::make_shared<HeldBytes>(limits.heldBytesPerProcess, limits.heldBytesPerUser),
                       std::move(memoryReturn),
                       OffenderLog(log),
                       PeerPace(limits.pace),
                       queues.createSerialQueue("com.vorlan.typhond.largeMessages"),
                       {},
                       {}});
}

}  // namespace

LinuxIpc::LinuxIpc(EventPool& pool, WorkQueues& queues, Log& log, RootDirectory root,
                   IdentifyPeer identifyPeer, IpcLimits limits, EndpointHandshake endpointHandshake)
    : context_(
          makeContext(pool, queues, log, std::move(root), std::move(identifyPeer), limits, endpointHandshake))
{}

LinuxIpc::~LinuxIpc()
{
    for (const auto& listener : context_->listeners.all()) {
        listener->invalidate();
    }
    for (const auto& connection : context_->connections.all()) {
        connection->invalidate();
    }
}

std::shared_ptr<Listener> LinuxIpc::listenerForService(std::string name)
{
    return LinuxListener::ofService(context_, std::move(name));
}

std::shared_ptr<Listener> LinuxIpc::anonymousListener()
{
    auto socket = listenAnonymously(context_->root);
    if (!socket.socket) {
        TYLog_Error(context_->log, "cannot make an anonymous listener: " + socket.problem);
    }
    return std::make_shared<LinuxListener>(context_, "an anonymous listener", std::move(socket),
                                           endpointRole(*context_));
}

std::shared_ptr<Connection> LinuxIpc::connectionToEndpoint(std::shared_ptr<ListenerEndpoint> endpoint)
{
    auto connector = [context = std::weak_ptr(context_), endpoint]() -> ConnectedSocket {
        const auto alive = context.lock();
        return alive ? connectToEndpoint(*alive, endpoint) : ConnectedSocket{};
    };
    return std::make_shared<LinuxConnection>(context_, LinuxConnection::Lifetime::oneSocket,
                                             std::move(connector));
}

std::shared_ptr<Connection> LinuxIpc::connectionToService(std::string name)
{
    auto connector = [context = std::weak_ptr(context_), name]() -> ConnectedSocket {
        const auto alive = context.lock();
        return alive ? connectToService(*alive, name) : ConnectedSocket{};
    };
    return std::make_shared<LinuxConnection>(context_, LinuxConnection::Lifetime::service,
                                             std::move(connector));
}

std::size_t LinuxIpc::connectionCount() const
{
    return context_->connections.all().size();
}

}  // namespace typhon
