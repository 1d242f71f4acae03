#pragma once

#include "platform/linux/notification_names.h"
#include "platform/linux/system_bus.h"
#include "platform/linux/trusted_bus_name.h"
#include "platform/linux/trusted_users.h"
#include "platform/log.h"
#include "platform/property_list.h"
#include "platform/work_queue.h"

#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include <systemd/sd-bus.h>

namespace typhon {

/// The signals of one announcing service, on their way to a handler. All but `setHandler` on the bus's queue.
class NotificationStream : public std::enable_shared_from_this<NotificationStream> {
public:
    using Handler = std::function<void(PropertyList event)>;

    NotificationStream(const NotificationService& service, TrustsUser trusts, Log& log);

    /// Any thread.
    void setHandler(std::shared_ptr<WorkQueue> queue, Handler handler);

    void connected(sd_bus* bus);
    void lost();
    /// To be shown every message of the connection.
    void received(sd_bus* bus, sd_bus_message* message);

private:
    void take(sd_bus_message* signal, TrustedBusName::Standing standing);
    void ownerDecided();
    void deliver(PropertyList event);

    const NotificationService service_;
    const TrustsUser trusts_;
    Log& log_;

    std::mutex mutex_;
    // Protected by the mutex.
    std::shared_ptr<WorkQueue> queue_;
    Handler handler_;

    // Owned by the bus's queue.
    std::shared_ptr<TrustedBusName> owner_;
    /// Events of an owner that is not known well enough yet.
    std::deque<PropertyList> held_;
};

/// Both streams on one connection.
class NotificationStreams final : public SystemBusUser {
public:
    NotificationStreams(const TrustsUser& trusts, Log& log);

    /// Null for a stream that does not exist.
    NotificationStream* streamOf(const std::string& name);

    void busConnected(sd_bus* bus) override;
    void busLost() override;

private:
    static int sawMessage(sd_bus_message* message, void* streams, sd_bus_error* error);

    const std::shared_ptr<NotificationStream> ping_;
    const std::shared_ptr<NotificationStream> relay_;
};

}  // namespace typhon
