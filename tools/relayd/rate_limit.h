#pragma once

#include <algorithm>
#include <chrono>

namespace typhon {

/// Admits so many events a second in the long run, and as many as that in one burst. One thread.
class RateLimit {
public:
    using Time = std::chrono::steady_clock::time_point;

    explicit RateLimit(double perSecond) : perSecond_(perSecond), available_(perSecond) {}

    /// Whether an event at that time, which never goes back, is admitted.
    bool admits(Time now)
    {
        const std::chrono::duration<double> elapsed = now - last_;
        last_ = now;
        available_ = std::min(perSecond_, available_ + elapsed.count() * perSecond_);
        if (available_ < 1) {
            return false;
        }
        available_ -= 1;
        return true;
    }

private:
    const double perSecond_;
    double available_;
    Time last_;
};

}  // namespace typhon
