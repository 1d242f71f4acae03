#pragma once

#include "platform/clock.h"

namespace typhon {

/// The kernel's realtime and boot clocks.
class LinuxClock final : public Clock {
public:
    double now() const override;
    std::chrono::nanoseconds uptime() const override;
};

}  // namespace typhon
