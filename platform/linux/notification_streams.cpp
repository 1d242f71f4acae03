#include "platform/linux/notification_streams.h"

#include "platform/linux/bus_calls.h"
#include "platform/notifications.h"

#include <optional>
#include <utility>
#include <variant>

namespace typhon {

namespace {

/// Events kept while it is being asked who announces them.
constexpr std::size_t mostHeld = 64;

std::optional<PropertyList> eventOf(sd_bus_message* signal, const char* types)
{
    auto reading = readMessage(signal, types, std::nullopt, notificationLimits);
    if (!reading.arguments) {
        return std::nullopt;
    }
    PropertyList::Dictionary event;
    event.emplace(event_streams::eventName, std::get<PropertyList>(reading.arguments->at(0)));
    if (reading.arguments->size() > 1) {
        event.emplace(event_streams::userInfo, std::get<PropertyList>(reading.arguments->at(1)));
    }
    return PropertyList(std::move(event));
}

}  // namespace

NotificationStream::NotificationStream(const NotificationService& service, TrustsUser trusts, Log& log)
    : service_(service), trusts_(std::move(trusts)), log_(log)
{}

void NotificationStream::setHandler(std::shared_ptr<WorkQueue> queue, Handler handler)
{
    const std::lock_guard lock(mutex_);
    queue_ = std::move(queue);
    handler_ = std::move(handler);
}

void NotificationStream::connected(sd_bus* bus)
{
    const auto signals = std::string("type='signal',sender='") + service_.name + "',path='" + service_.path +
                         "',interface='" + service_.name + "',member='" + notificationSignal + "'";
    callBusDriver(bus, "AddMatch", signals, [](sd_bus_message*) {});
    owner_ = std::make_shared<TrustedBusName>(service_.name, trusts_, [weak = weak_from_this()] {
        if (const auto self = weak.lock()) {
            self->ownerDecided();
        }
    });
    owner_->follow(bus);
}

void NotificationStream::lost()
{
    held_.clear();
    owner_.reset();
}

void NotificationStream::received(sd_bus* bus, sd_bus_message* message)
{
    owner_->sawMessage(bus, message);
    if (sd_bus_message_is_signal(message, service_.name, notificationSignal) <= 0) {
        return;
    }
    const char* path = sd_bus_message_get_path(message);
    const auto standing = owner_->standingOf(sd_bus_message_get_sender(message));
    if (standing != TrustedBusName::Standing::stranger && path != nullptr &&
        std::string_view(path) == service_.path) {
        take(message, standing);
    }
}

void NotificationStream::take(sd_bus_message* signal, TrustedBusName::Standing standing)
{
    auto event = eventOf(signal, service_.types);
    if (!event) {
        TYLog_Debug(log_, std::string("malformed notification of ") + service_.name + " ignored");
    } else if (standing == TrustedBusName::Standing::trusted) {
        deliver(std::move(*event));
    } else if (held_.size() < mostHeld) {
        held_.push_back(std::move(*event));
    }
}

void NotificationStream::ownerDecided()
{
    auto events = std::exchange(held_, {});
    if (owner_ && owner_->standing() == TrustedBusName::Standing::trusted) {
        for (auto& event : events) {
            deliver(std::move(event));
        }
    }
}

void NotificationStream::deliver(PropertyList event)
{
    const std::lock_guard lock(mutex_);
    if (queue_) {
        queue_->async([handler = handler_, event = std::move(event)] { handler(event); });
    }
}

NotificationStreams::NotificationStreams(const TrustsUser& trusts, Log& log)
    : ping_(std::make_shared<NotificationStream>(pingService, trusts, log)),
      relay_(std::make_shared<NotificationStream>(relayService, trusts, log))
{}

NotificationStream* NotificationStreams::streamOf(const std::string& name)
{
    return name == event_streams::notifyCentre  ? ping_.get()
           : name == event_streams::distributed ? relay_.get()
                                                : nullptr;
}

void NotificationStreams::busConnected(sd_bus* bus)
{
    sd_bus_add_filter(bus, nullptr, sawMessage, this);
    ping_->connected(bus);
    relay_->connected(bus);
}

void NotificationStreams::busLost()
{
    ping_->lost();
    relay_->lost();
}

int NotificationStreams::sawMessage(sd_bus_message* message, void* streams, sd_bus_error*)
{
    auto& self = *static_cast<NotificationStreams*>(streams);
    auto* bus = sd_bus_message_get_bus(message);
    self.ping_->received(bus, message);
    self.relay_->received(bus, message);
    return 0;
}

}  // namespace typhon
