#pragma once

#include <chrono>

namespace typhon {

/// Wall clock and boot clock. Any thread.
class Clock {
public:
    virtual ~Clock() = default;
    /// Seconds since the Unix epoch; may be stepped forwards and backwards.
    virtual double now() const = 0;
    /// Time since boot, sleep included; never goes back.
    virtual std::chrono::nanoseconds uptime() const = 0;
};

}  // namespace typhon
