#pragma once

#include "platform/ipc.h"
#include "platform/linux/bus_link.h"
#include "platform/linux/ipc_context.h"
#include "platform/linux/listening_sockets.h"

#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

namespace typhon {

/// Accepts connections on a Unix socket. Any thread.
class LinuxListener : public Listener, public std::enable_shared_from_this<LinuxListener> {
public:
    /// `name` is for messages; `role` is ours in the handshake of accepted connections.
    LinuxListener(std::shared_ptr<IpcContext> context, std::string name, ListeningSocket socket,
                  BusLink::Role role);
    /// The listener of a named service. While another process holds the name, `resume` begins to try for it.
    static std::shared_ptr<LinuxListener> ofService(std::shared_ptr<IpcContext> context, std::string name);
    ~LinuxListener() override;

    void setDelegate(std::weak_ptr<ListenerDelegate> delegate) override;
    void resume() override;
    void invalidate() override;
    std::shared_ptr<ListenerEndpoint> endpoint() const override;

private:
    enum class Accepting { more, done, later };

    void watchSocket();
    void tryForNameLater();
    void tryForName();
    void handleEvents();
    Accepting acceptOne(int listening);
    Accepting acceptFailed(int listening, int error);
    void logRefusal(int error);
    void offer(FileDescriptor socket);
    void arm();
    void armLater();
    void closeSocket();

    const std::shared_ptr<IpcContext> context_;
    const std::string name_;
    const BusLink::Role role_;

    mutable std::mutex mutex_;
    // Below: protected by the mutex.
    /// Shared with the thread that accepts. Null when there is none (any more).
    std::shared_ptr<const ListeningSocket> socket_;
    std::weak_ptr<ListenerDelegate> delegate_;
    std::unique_ptr<EventPool::Watch> watch_;
    std::unique_ptr<Timer> retry_;
    /// When to give up trying for the name.
    std::optional<std::chrono::steady_clock::time_point> nameDeadline_;

    // Below: used by the one thread that handles the watch.
    /// Given up to accept, and close, a connection when there are no other descriptors left.
    FileDescriptor reserve_;
    std::optional<std::chrono::steady_clock::time_point> refusalLogged_;
};

}  // namespace typhon
