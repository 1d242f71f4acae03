#pragma once

#include "platform/linux/event_pool.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/trusted_users.h"
#include "platform/log.h"
#include "platform/notifications.h"
#include "platform/work_queues.h"

#include <functional>
#include <memory>
#include <string>

namespace typhon {

class NotificationStreams;
class SystemBus;

/// The system's notifications, as signals on the system bus (under a scratch root: the bus that listens in
/// that folder). An event is taken from whoever owns the announcing service's name at present and runs as
/// a trusted user, from nobody else. Without a bus nothing arrives and what is posted is
/// dropped; the connection is made as soon as the bus is there. Handlers get the notifications that the
/// service registration subscribes them to (see `subscribedNotifications`).
class LinuxNotifications final : public Notifications {
public:
    /// The services outlive everything here, the work on their queues included.
    LinuxNotifications(EventPool& pool, WorkQueues& queues, Log& log, const RootDirectory& root,
                       const TrustsUser& trusts = isRootOrOwnUser);
    ~LinuxNotifications() override;

    /// Begins to connect. Once; before it nothing arrives and what is posted is dropped.
    void start();

    void setEventStreamHandler(const std::string& stream, std::shared_ptr<WorkQueue> queue,
                               std::function<void(PropertyList event)> handler) override;
    void postNotifyCentreNotification(const std::string& name) override;

private:
    Log& log_;
    const RootDirectory root_;
    const std::shared_ptr<NotificationStreams> streams_;
    const std::shared_ptr<SystemBus> bus_;
};

}  // namespace typhon
