#include "platform/simulated/simulated_notifications.h"

namespace typhon {

void SimulatedNotifications::deliver(const std::string& stream, PropertyList event)
{
    const auto found = streams_.find(stream);
    if (found != streams_.end()) {
        found->second.queue->async(
            [handler = found->second.handler, event = std::move(event)] { handler(event); });
    }
}

void SimulatedNotifications::deliverNotifyCentre(const std::string& name)
{
    deliver(event_streams::notifyCentre, PropertyList::Dictionary{{event_streams::eventName, name}});
}

void SimulatedNotifications::deliverDistributed(const std::string& name, PropertyList userInfo)
{
    deliver(event_streams::distributed,
            PropertyList::Dictionary{{event_streams::eventName, name},
                                     {event_streams::userInfo, std::move(userInfo)}});
}

}  // namespace typhon
