#pragma once

#include "platform/linux/bus_message.h"
#include "platform/linux/notification_names.h"
#include "platform/linux/system_bus.h"
#include "platform/linux/trusted_users.h"
#include "platform/log.h"
#include "platform/property_list.h"
#include "tools/relayd/rate_limit.h"

#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include <systemd/sd-bus.h>

namespace typhon {

/// One of the two announcing services on a connection: owns its name, takes `Post` from processes of
/// certain users, and announces what was posted as a signal. Has to be held by a
/// shared pointer. On the bus's queue only.
class AnnouncingService : public std::enable_shared_from_this<AnnouncingService> {
public:
    AnnouncingService(const NotificationService& service, TrustsUser mayPost, Log& log, double postsASecond);

    void connected(sd_bus* bus);
    void lost();
    /// To be shown every message of the connection.
    void received(sd_bus_message* message);

    /// Announces by this process's own right; kept until there is a bus and the name is this process's. When
    /// too many wait, the oldest are dropped.
    void announce(Arguments notification);

private:
    /// What was posted, while it is being asked by whom.
    struct Post {
        BusMessage call;
        Arguments notification;
    };

    static const sd_bus_vtable* membersOf(const NotificationService& service);
    static int postCalled(sd_bus_message* call, void* service, sd_bus_error* error);

    int takePost(sd_bus_message* call);
    void decidePost(std::uint64_t number, sd_bus_message* user);
    void announceWaiting();
    /// Null, or what went wrong.
    std::optional<IpcError> emit(const Arguments& notification);

    const NotificationService service_;
    const TrustsUser mayPost_;
    Log& log_;
    sd_bus* bus_ = nullptr;
    bool isOwner_ = false;
    /// Not held by the question, which the bus holds: a message holds its bus.
    std::map<std::uint64_t, Post> undecided_;
    std::uint64_t lastPost_ = 0;
    RateLimit rate_;
    RateLimit refusalsLogged_;
    std::deque<Arguments> waiting_;
};

/// The relay on one connection: both services.
class NotificationRelay final : public SystemBusUser {
public:
    NotificationRelay(const TrustsUser& mayPost, Log& log, double postsASecond = 1000);

    void busConnected(sd_bus* bus) override;
    void busLost() override;

    /// Announces a distributed notification by this process's own right.
    void announceDistributed(const std::string& name, PropertyList::Dictionary userInfo);

private:
    static int sawMessage(sd_bus_message* message, void* relay, sd_bus_error* error);

    const std::shared_ptr<AnnouncingService> ping_;
    const std::shared_ptr<AnnouncingService> relay_;
};

}  // namespace typhon
