#include "platform/linux/linux_notifications.h"

#include "platform/linux/bus_calls.h"
#include "platform/linux/notification_names.h"
#include "platform/linux/notification_streams.h"
#include "platform/linux/subscribed_notifications.h"
#include "platform/linux/system_bus.h"

#include <cstdint>
#include <utility>

namespace typhon {

namespace {

/// Messages that the bus has not taken yet; what is posted beyond is dropped.
constexpr std::uint64_t mostUnsent = 1024;

void post(sd_bus* bus, const std::string& name, Log& log)
{
    std::uint64_t unsent = 0;
    sd_bus_get_n_queued_write(bus, &unsent);
    auto call = newBusCall(bus, pingService.name, pingService.path, pingService.name, postMethod);
    if (unsent >= mostUnsent || !call || sd_bus_message_append(call.get(), "s", name.c_str()) < 0) {
        TYLog_Error(log, "notification \"" + name + "\" cannot be posted");
        return;
    }
    callOnBus(bus, std::move(call), [name, &log](sd_bus_message* reply) {
        if (sd_bus_message_is_method_error(reply, nullptr) > 0) {
            TYLog_Debug(log, "notification \"" + name + "\" was not posted: " + textOfBusError(reply));
        }
    });
}

}  // namespace

LinuxNotifications::LinuxNotifications(EventPool& pool, WorkQueues& queues, Log& log,
                                       const RootDirectory& root, const TrustsUser& trusts)
    : log_(log), root_(root), streams_(std::make_shared<NotificationStreams>(trusts, log)),
      bus_(std::make_shared<SystemBus>(pool, queues, log, root.real(systemBusSocket)))
{}

LinuxNotifications::~LinuxNotifications() = default;

void LinuxNotifications::start()
{
    bus_->start(streams_);
}

void LinuxNotifications::setEventStreamHandler(const std::string& stream, std::shared_ptr<WorkQueue> queue,
                                               std::function<void(PropertyList event)> handler)
{
    if (auto names = subscribedNotifications(root_, stream)) {
        handler = [names = *std::move(names), handler = std::move(handler)](const PropertyList& event) {
            const auto* name = event.find(event_streams::eventName);
            if (name != nullptr && name->asString() != nullptr && names.contains(*name->asString())) {
                handler(event);
            }
        };
    }
    if (auto* target = streams_->streamOf(stream)) {
        target->setHandler(std::move(queue), std::move(handler));
    } else {
        TYLog_Error(log_, "there is no event stream \"" + stream + "\"");
    }
}

void LinuxNotifications::postNotifyCentreNotification(const std::string& name)
{
    bus_->withBus([name, &log = log_](sd_bus* bus) { post(bus, name, log); });
}

}  // namespace typhon
