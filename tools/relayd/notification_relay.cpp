// Whoever can post can make every listener on the machine act, so it is asked of the bus, for every post,
// which user the sender runs as; the bus's policy says the same, but a policy file can be edited. Between the
// question and the answer a post waits, and only so many wait at once.

#include "tools/relayd/notification_relay.h"

#include "platform/linux/bus_calls.h"

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <utility>
#include <variant>

namespace typhon {

namespace {

/// Posts whose sender is being asked for.
constexpr std::size_t mostUndecided = 256;
/// Notifications of this process's own that wait for the bus.
constexpr std::size_t mostWaiting = 1024;
/// Messages that the bus has not taken yet.
constexpr std::uint64_t mostUnsent = 4096;

constexpr std::uint32_t inQueueForName = 2;

constexpr const char* busDriver = "org.freedesktop.DBus";

std::string errorText(int error)
{
    return std::strerror(-error);
}

void refuse(sd_bus_message* call, const IpcError& error)
{
    sd_bus_reply_method_errorf(call, error.name.c_str(), "%s", error.message.c_str());
}

/// What is wrong with a notification that somebody wants to post, or an empty text.
std::string complaintAbout(const std::optional<Arguments>& notification)
{
    if (!notification) {
        return "the notification is malformed or too large";
    }
    const auto* name = std::get<PropertyList>(notification->front()).asString();
    if (name->empty() || name->size() > longestNotificationName) {
        return "a notification's name has 1 to " + std::to_string(longestNotificationName) + " bytes";
    }
    return {};
}

}  // namespace

AnnouncingService::AnnouncingService(const NotificationService& service, TrustsUser mayPost, Log& log,
                                     double postsASecond)
    : service_(service), mayPost_(std::move(mayPost)), log_(log), rate_(postsASecond), refusalsLogged_(1)
{}

const sd_bus_vtable* AnnouncingService::membersOf(const NotificationService& service)
{
    static const sd_bus_vtable named[] = {
        SD_BUS_VTABLE_START(0),
        SD_BUS_METHOD_WITH_NAMES("Post", "s", SD_BUS_PARAM(name), "", "", postCalled,
                                 SD_BUS_VTABLE_UNPRIVILEGED),
        SD_BUS_SIGNAL_WITH_NAMES("Notification", "s", SD_BUS_PARAM(name), 0),
        SD_BUS_VTABLE_END,
    };
    static const sd_bus_vtable withUserInfo[] = {
        SD_BUS_VTABLE_START(0),
        SD_BUS_METHOD_WITH_NAMES("Post", "sa{sv}", SD_BUS_PARAM(name) SD_BUS_PARAM(userInfo), "", "",
                                 postCalled, SD_BUS_VTABLE_UNPRIVILEGED),
        SD_BUS_SIGNAL_WITH_NAMES("Notification", "sa{sv}", SD_BUS_PARAM(name) SD_BUS_PARAM(userInfo), 0),
        SD_BUS_VTABLE_END,
    };
    return std::string_view(service.types) == pingService.types ? named : withUserInfo;
}

void AnnouncingService::connected(sd_bus* bus)
{
    bus_ = bus;
    sd_bus_add_object_vtable(bus, nullptr, service_.path, service_.name, membersOf(service_), this);
    auto request = newBusCall(bus, busDriver, "/org/freedesktop/DBus", busDriver, "RequestName");
    if (!request || sd_bus_message_append(request.get(), "su", service_.name, 0U) < 0) {
        return;
    }
    callOnBus(bus, std::move(request),
              [name = std::string(service_.name), &log = log_](sd_bus_message* reply) {
                  std::uint32_t outcome = 0;
                  if (sd_bus_message_is_method_error(reply, nullptr) > 0) {
                      TYLog_Error(log, "cannot own the name " + name + ": " + textOfBusError(reply));
                  } else if (sd_bus_message_read(reply, "u", &outcome) >= 0 && outcome == inQueueForName) {
                      TYLog_Error(log, "the name " + name + " is another process's; waiting for it");
                  }
              });
}

void AnnouncingService::lost()
{
    bus_ = nullptr;
    isOwner_ = false;
    undecided_.clear();
}

void AnnouncingService::received(sd_bus_message* message)
{
    const char* sender = sd_bus_message_get_sender(message);
    const bool acquired = sd_bus_message_is_signal(message, busDriver, "NameAcquired") > 0;
    const bool lostIt = sd_bus_message_is_signal(message, busDriver, "NameLost") > 0;
    if ((!acquired && !lostIt) || sender == nullptr || std::string_view(sender) != busDriver) {
        return;
    }
    const char* name = nullptr;
    if (sd_bus_message_read(message, "s", &name) >= 0 && std::string_view(name) == service_.name) {
        isOwner_ = acquired;
        TYLog_Debug(log_, std::string(acquired ? "owns " : "lost ") + service_.name);
        announceWaiting();
    }
    sd_bus_message_rewind(message, 1);
}

void AnnouncingService::announce(Arguments notification)
{
    waiting_.push_back(std::move(notification));
    if (waiting_.size() > mostWaiting) {
        waiting_.pop_front();
        TYLog_Error(log_, std::string("too many notifications of ") + service_.name + " wait for the bus");
    }
    announceWaiting();
}

void AnnouncingService::announceWaiting()
{
    while (isOwner_ && !waiting_.empty()) {
        if (const auto problem = emit(waiting_.front())) {
            TYLog_Error(log_, "a notification was not announced: " + problem->message);
        }
        waiting_.pop_front();
    }
}

int AnnouncingService::postCalled(sd_bus_message* call, void* service, sd_bus_error*)
{
    return static_cast<AnnouncingService*>(service)->takePost(call);
}

int AnnouncingService::takePost(sd_bus_message* call)
{
    if (undecided_.size() >= mostUndecided) {
        refuse(call, {ipc_errors::limitsExceeded, "too many notifications are being posted"});
        return 1;
    }
    auto notification = readMessage(call, service_.types, std::nullopt, notificationLimits).arguments;
    const auto complaint = complaintAbout(notification);
    if (!complaint.empty()) {
        refuse(call, {ipc_errors::invalidArguments, complaint});
        return 1;
    }
    const auto number = ++lastPost_;
    undecided_.emplace(number, Post{BusMessage(sd_bus_message_ref(call)), std::move(*notification)});
    callBusDriver(bus_, "GetConnectionUnixUser", sd_bus_message_get_sender(call),
                  [weak = weak_from_this(), number](sd_bus_message* user) {
                      if (const auto self = weak.lock()) {
                          self->decidePost(number, user);
                      }
                  });
    return 1;
}

void AnnouncingService::decidePost(std::uint64_t number, sd_bus_message* user)
{
    const auto post = undecided_.extract(number);
    if (post.empty()) {
        return;
    }
    auto* const call = post.mapped().call.get();
    const auto now = std::chrono::steady_clock::now();
    std::uint32_t poster = 0;
    const bool isKnown =
        sd_bus_message_is_method_error(user, nullptr) <= 0 && sd_bus_message_read(user, "u", &poster) >= 0;
    if (!isKnown || !mayPost_(poster)) {
        if (refusalsLogged_.admits(now)) {
            TYLog_Error(log_, std::string("refused a notification that was posted to ") + service_.name +
                                  (isKnown ? " by user " + std::to_string(poster) : " by nobody knows whom"));
        }
        refuse(call,
               {ipc_errors::accessDenied, "only root and typhon's own services may post notifications"});
    } else if (!rate_.admits(now)) {
        refuse(call, {ipc_errors::limitsExceeded, "too many notifications in one second"});
    } else if (const auto problem = emit(post.mapped().notification)) {
        refuse(call, *problem);
    } else {
        sd_bus_reply_method_return(call, "");
    }
}

std::optional<IpcError> AnnouncingService::emit(const Arguments& notification)
{
    std::uint64_t unsent = 0;
    sd_bus_get_n_queued_write(bus_, &unsent);
    if (!isOwner_ || unsent >= mostUnsent) {
        return IpcError{ipc_errors::failed,
                        isOwner_ ? "the bus does not keep up"
                                 : std::string("the name ") + service_.name + " is not this process's"};
    }
    sd_bus_message* raw = nullptr;
    int result = sd_bus_message_new_signal(bus_, &raw, service_.path, service_.name, notificationSignal);
    const BusMessage signal(raw);
    if (result >= 0) {
        result = appendArguments(raw, service_.types, notification, false);
    }
    if (result >= 0) {
        result = sd_bus_send(bus_, raw, nullptr);
    }
    return result >= 0 ? std::nullopt : std::optional(IpcError{ipc_errors::failed, errorText(result)});
}

NotificationRelay::NotificationRelay(const TrustsUser& mayPost, Log& log, double postsASecond)
    : ping_(std::make_shared<AnnouncingService>(pingService, mayPost, log, postsASecond)),
      relay_(std::make_shared<AnnouncingService>(relayService, mayPost, log, postsASecond))
{}

void NotificationRelay::busConnected(sd_bus* bus)
{
    sd_bus_add_filter(bus, nullptr, sawMessage, this);
    ping_->connected(bus);
    relay_->connected(bus);
}

void NotificationRelay::busLost()
{
    ping_->lost();
    relay_->lost();
}

void NotificationRelay::announceDistributed(const std::string& name, PropertyList::Dictionary userInfo)
{
    relay_->announce({PropertyList(name), PropertyList(std::move(userInfo))});
}

int NotificationRelay::sawMessage(sd_bus_message* message, void* relay, sd_bus_error*)
{
    auto& self = *static_cast<NotificationRelay*>(relay);
    self.ping_->received(message);
    self.relay_->received(message);
    return 0;
}

}  // namespace typhon
