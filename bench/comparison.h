#pragma once

#include <cstddef>
#include <functional>
#include <vector>

namespace typhon::bench {

/// The middle of many measurements and how far they spread.
struct Summary {
    double median = 0;
    double lowerQuartile = 0;
    double upperQuartile = 0;
};

Summary summaryOf(std::vector<double> measurements);

/// Does one piece of work and gives what it cost: seconds, or bytes.
using Step = std::function<double()>;

/// How often something is measured.
struct Effort {
    /// How often the two are measured in turn.
    std::size_t rounds = 20;
    /// How often each is measured in a round, and how often before, unmeasured.
    std::size_t steps = 50;
    std::size_t warmUp = 20;
};

/// Two pieces of work, measured in turn so that a busy machine hits both alike.
struct Comparison {
    Summary ours;
    Summary peer;
    /// The ratio of the medians.
    double ratio() const { return ours.median / peer.median; }
};

Comparison compare(const Step& ours, const Step& peer, const Effort& effort);

/// Wall-clock seconds since some moment.
double secondsNow();

/// A step that takes what `work` takes. What `work` returns is released outside the measurement.
template <class Work>
Step timed(Work work)
{
    return [work] {
        const auto begin = secondsNow();
        [[maybe_unused]] const auto result = work();
        return secondsNow() - begin;
    };
}

}  // namespace typhon::bench
