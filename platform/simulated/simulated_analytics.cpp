#include "platform/simulated/simulated_analytics.h"

#include <utility>

namespace typhon {

void SimulatedAnalytics::sendEventLazily(std::string name, std::function<PropertyList()> builder)
{
    ++offered_;
    if (!isCollecting_) {
        return;
    }
    scheduler_.post(this, [this, name = std::move(name), builder = std::move(builder)] {
        events_.push_back({name, builder()});
    });
}

}  // namespace typhon
