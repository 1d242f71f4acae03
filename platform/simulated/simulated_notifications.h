#pragma once

#include "platform/notifications.h"

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace typhon {

/// The system's notifications, as far as a test sends them. One thread.
class SimulatedNotifications final : public Notifications {
public:
    void setEventStreamHandler(const std::string& stream, std::shared_ptr<WorkQueue> queue,
                               std::function<void(PropertyList event)> handler) override
    {
        streams_.insert_or_assign(stream, Stream{std::move(queue), std::move(handler)});
    }
    void postNotifyCentreNotification(const std::string& name) override { posted_.push_back(name); }

    /// Every name that was posted, in order.
    const std::vector<std::string>& posted() const { return posted_; }
    bool hasHandler(const std::string& stream) const { return streams_.contains(stream); }

    /// Has that event arrive on a stream; lost when nobody handles the stream. The event may be anything,
    /// also what no service would send.
    void deliver(const std::string& stream, PropertyList event);
    /// Has a well-formed notify-centre notification arrive.
    void deliverNotifyCentre(const std::string& name);
    /// Has a well-formed distributed notification arrive.
    void deliverDistributed(const std::string& name, PropertyList userInfo);

private:
    struct Stream {
        std::shared_ptr<WorkQueue> queue;
        std::function<void(PropertyList)> handler;
    };
    std::map<std::string, Stream> streams_;
    std::vector<std::string> posted_;
};

}  // namespace typhon
