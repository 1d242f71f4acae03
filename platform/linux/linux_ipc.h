#pragma once

#include "platform/ipc.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/ipc_context.h"
#include "platform/linux/ipc_limits.h"
#include "platform/linux/root_directory.h"

#include <memory>
#include <string>

namespace typhon {

/// The D-Bus wire protocol over Unix sockets, peer to peer. Services are sockets in /run/typhon. Any thread.
class LinuxIpc : public Ipc {
public:
    /// `pool`, `queues` and `log` outlive this and every connection made here. `identifyPeer` is called on
    /// threads of the pool and of callers.
    LinuxIpc(EventPool& pool, WorkQueues& queues, Log& log, RootDirectory root, IdentifyPeer identifyPeer,
             IpcLimits limits = {}, EndpointHandshake endpointHandshake = EndpointHandshake::server);
    /// Invalidates every listener and connection.
    ~LinuxIpc() override;

    std::shared_ptr<Listener> listenerForService(std::string name) override;
    std::shared_ptr<Listener> anonymousListener() override;
    std::shared_ptr<Connection> connectionToEndpoint(std::shared_ptr<ListenerEndpoint> endpoint) override;
    std::shared_ptr<Connection> connectionToService(std::string name) override;

    /// Connections that are resumed and not yet invalidated.
    std::size_t connectionCount() const;
    /// Where large messages are understood, one after another.
    WorkQueue& largeMessages() const { return *context_->largeMessages; }

private:
    const std::shared_ptr<IpcContext> context_;
};

}  // namespace typhon
