#pragma once

#include "platform/ipc.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"
#include "protocol/wire.h"
#include "sdk/client_result.h"
#include "sdk/peer_call.h"

#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

struct sd_bus;

namespace typhon {

/// A blocking connection to one of the system's services, for one thread at a time. Calls wait without
/// limit for their reply, unless given one, and fail at once when the connection ends; after that every call
/// fails.
class ServiceConnection {
public:
    using CallHandler = std::function<void(const PeerCall&)>;
    using Clock = std::chrono::steady_clock;
    /// Null: without limit.
    using Patience = std::optional<std::chrono::milliseconds>;

    static ClientResult<ServiceConnection> open(const RootDirectory& root, std::string_view serviceName);
    /// Over a connected socket, with the client's part in the handshake. `peer` is for messages.
    static ClientResult<ServiceConnection> overSocket(FileDescriptor socket, const std::string& peer);

    ServiceConnection(ServiceConnection&& other) noexcept;
    ServiceConnection& operator=(ServiceConnection&& other) noexcept;
    ServiceConnection(const ServiceConnection&) = delete;
    ServiceConnection& operator=(const ServiceConnection&) = delete;
    ~ServiceConnection();

    /// Calls an operation of the service. One that never answers is sent, and gives no results. Values that
    /// arrive as sealed memory files are put back in their places.
    ClientResult<Arguments> call(const wire::Operation& operation, const Arguments& arguments,
                                 Patience patience = std::nullopt);

    /// What the peer calls goes there, while `call` or `process` runs. Without it every call is refused.
    void setCallHandler(CallHandler handler) { handler_ = std::move(handler); }
    /// Handles everything that has arrived, without waiting.
    ClientResult<Done> process();
    /// The socket, and what to poll it for; handle everything with `process` before.
    int descriptor() const;
    short events() const;

    /// False once the connection has ended.
    bool isOpen() const;

private:
    explicit ServiceConnection(sd_bus* bus) : bus_(bus) {}
    ClientResult<Arguments> callAndRead(const wire::Operation& operation, const Arguments& arguments,
                                        Patience patience);

    sd_bus* bus_ = nullptr;
    CallHandler handler_;
};

}  // namespace typhon
