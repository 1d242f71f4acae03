#pragma once

#include "platform/property_list.h"
#include "platform/work_queue.h"

#include <functional>
#include <memory>
#include <string>

namespace typhon {

/// The system's notification event streams.
namespace event_streams {
/// Notify-centre notifications: a name, no payload.
inline constexpr const char* notifyCentre = "com.vorlan.pingd.matching";
/// Distributed notifications: a name and a dictionary.
inline constexpr const char* distributed = "com.vorlan.relayd.matching";

/// The key of an event's notification name (string).
inline constexpr const char* eventName = "EventName";
/// The key of a distributed notification's payload (dictionary).
inline constexpr const char* userInfo = "UserInfo";
}  // namespace event_streams

/// The notifications that pass between the processes of the system. Any thread.
class Notifications {
public:
    virtual ~Notifications() = default;
    /// Has `handler` run on `queue` with every event of that stream, in the order of arrival, for the life of
    /// the process. Each event is a dictionary with the keys above. One handler a stream; a second one takes
    /// the place of the first.
    virtual void setEventStreamHandler(const std::string& stream, std::shared_ptr<WorkQueue> queue,
                                       std::function<void(PropertyList event)> handler) = 0;
    /// Posts a notify-centre notification to the whole system, without a payload. Returns at once; when the
    /// system's notification service is not there, the notification is dropped.
    virtual void postNotifyCentreNotification(const std::string& name) = 0;
};

}  // namespace typhon
