#pragma once

#include "platform/ipc.h"

#include <memory>
#include <utility>

namespace typhon {

/// Answers the calls of one connection to a service whose operations take no time. A connection may outlive
/// the service by a moment.
template <typename Service>
class ServiceObject final : public ExportedObject {
public:
    /// `service` is null once it is gone.
    using Answer = void (*)(Service* service, IncomingCall& call);

    ServiceObject(std::weak_ptr<Service> service, Answer answer)
        : service_(std::move(service)), answer_(answer)
    {}

    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        const auto service = service_.lock();
        answer_(service.get(), *call);
        co_return;
    }

private:
    const std::weak_ptr<Service> service_;
    const Answer answer_;
};

/// Lets a peer of such a service speak.
template <typename Service>
void accept(Connection& connection, std::weak_ptr<Service> service,
            typename ServiceObject<Service>::Answer answer)
{
    connection.setExportedInterfaces(Service::interfaces());
    connection.setExportedObject(std::make_shared<ServiceObject<Service>>(std::move(service), answer));
    connection.resume();
}

/// Opens the service under its name, for as long as the listener lives.
template <typename Service>
std::shared_ptr<Listener> startService(Ipc& ipc, const std::shared_ptr<Service>& service)
{
    auto listener = ipc.listenerForService(Service::serviceName);
    listener->setDelegate(service);
    listener->resume();
    return listener;
}

}  // namespace typhon
