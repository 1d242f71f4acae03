#pragma once

#include "platform/ipc.h"
#include "platform/linux/root_directory.h"
#include "protocol/wire.h"
#include "sdk/client_result.h"

#include <string_view>

struct sd_bus;

namespace typhon {

/// A blocking connection to one of the system's services, for one thread at a time. Calls wait without
/// limit for their reply, and fail at once when the connection ends; after that every call fails.
class ServiceConnection {
public:
    static ClientResult<ServiceConnection> open(const RootDirectory& root, std::string_view serviceName);

    ServiceConnection(ServiceConnection&& other) noexcept;
    ServiceConnection& operator=(ServiceConnection&& other) noexcept;
    ServiceConnection(const ServiceConnection&) = delete;
    ServiceConnection& operator=(const ServiceConnection&) = delete;
    ~ServiceConnection();

    /// Calls an operation of the service. One that never answers is sent, and gives no results. Values that
    /// arrive as sealed memory files are put back in their places.
    ClientResult<Arguments> call(const wire::Operation& operation, const Arguments& arguments);

    /// False once the connection has ended.
    bool isOpen() const;

private:
    explicit ServiceConnection(sd_bus* bus) : bus_(bus) {}
    ClientResult<Arguments> callAndRead(const wire::Operation& operation, const Arguments& arguments);
    void discardIncoming();

    sd_bus* bus_ = nullptr;
};

}  // namespace typhon
