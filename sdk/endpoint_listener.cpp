#include "sdk/endpoint_listener.h"

#include "sdk/client_errors.h"

#include <utility>

#include <sys/socket.h>

namespace typhon {

namespace {

/// Whoever holds the endpoint may connect; more than these wait.
constexpr std::size_t mostConnections = 16;

FileDescriptor acceptFrom(const FileDescriptor& listening)
{
    return FileDescriptor(::accept4(listening.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
}

}  // namespace

ClientResult<EndpointListener> EndpointListener::listen(const RootDirectory& root)
{
    auto socket = listenAnonymously(root);
    if (!socket.socket) {
        return clientError(ipc_errors::failed, "cannot make an endpoint: " + socket.problem);
    }
    return EndpointListener(std::move(socket));
}

void EndpointListener::accept()
{
    while (connections_.size() < mostConnections) {
        auto accepted = acceptFrom(socket_.socket);
        if (!accepted) {
            return;
        }
        auto connection = ServiceConnection::overSocket(std::move(accepted), "the daemon");
        if (connection) {
            connections_.push_back(std::move(*connection));
        }
    }
}

void EndpointListener::process(const Handler& handler)
{
    accept();
    connections_.remove_if([&handler](ServiceConnection& connection) {
        connection.setCallHandler(handler);
        return !connection.process();
    });
}

std::vector<pollfd> EndpointListener::descriptors() const
{
    std::vector<pollfd> all;
    if (connections_.size() < mostConnections) {
        all.push_back({socket_.socket.get(), POLLIN, 0});
    }
    for (const auto& connection : connections_) {
        all.push_back({connection.descriptor(), connection.events(), 0});
    }
    return all;
}

}  // namespace typhon
