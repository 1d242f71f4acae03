#pragma once

#include "platform/clock.h"
#include "platform/simulated/simulated_scheduler.h"

namespace typhon {

/// The virtual time of a scheduler, which outlives the clock.
class SimulatedClock final : public Clock {
public:
    explicit SimulatedClock(const SimulatedScheduler& scheduler) : scheduler_(scheduler) {}
    double now() const override { return scheduler_.wallClock(); }
    std::chrono::nanoseconds uptime() const override { return scheduler_.uptime(); }

private:
    const SimulatedScheduler& scheduler_;
};

}  // namespace typhon
