#pragma once

#include "platform/analytics.h"
#include "platform/simulated/simulated_scheduler.h"

#include <cstddef>
#include <string>
#include <vector>

namespace typhon {

/// An analytics service that, while it collects, builds what it is offered some time later. It collects until
/// the test says otherwise. One thread.
class SimulatedAnalytics final : public Analytics {
public:
    struct Event {
        std::string name;
        PropertyList payload;
    };

    /// `scheduler` outlives this.
    explicit SimulatedAnalytics(SimulatedScheduler& scheduler) : scheduler_(scheduler) {}

    void sendEventLazily(std::string name, std::function<PropertyList()> builder) override;

    void setCollecting(bool isCollecting) { isCollecting_ = isCollecting; }
    /// How often an event was offered, collected or not.
    std::size_t offered() const { return offered_; }
    /// The events that were built, in the order in which they were offered.
    const std::vector<Event>& events() const { return events_; }

private:
    SimulatedScheduler& scheduler_;
    bool isCollecting_ = true;
    std::size_t offered_ = 0;
    std::vector<Event> events_;
};

}  // namespace typhon
