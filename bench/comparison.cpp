#include "comparison.h"

#include <algorithm>
#include <chrono>

namespace typhon::bench {

namespace {

void repeat(const Step& step, std::size_t times, std::vector<double>& measurements)
{
    for (std::size_t time = 0; time < times; ++time) {
        measurements.push_back(step());
    }
}

}  // namespace

Summary summaryOf(std::vector<double> measurements)
{
    if (measurements.empty()) {
        return {};
    }
    std::ranges::sort(measurements);
    const auto last = measurements.size() - 1;
    return {measurements[last / 2], measurements[last / 4], measurements[last * 3 / 4]};
}

Comparison compare(const Step& ours, const Step& peer, const Effort& effort)
{
    std::vector<double> unmeasured;
    repeat(ours, effort.warmUp, unmeasured);
    repeat(peer, effort.warmUp, unmeasured);
    std::vector<double> oursMeasured;
    std::vector<double> peerMeasured;
    for (std::size_t round = 0; round < effort.rounds; ++round) {
        const bool oursFirst = round % 2 == 0;
        repeat(oursFirst ? ours : peer, effort.steps, oursFirst ? oursMeasured : peerMeasured);
        repeat(oursFirst ? peer : ours, effort.steps, oursFirst ? peerMeasured : oursMeasured);
    }
    return {summaryOf(std::move(oursMeasured)), summaryOf(std::move(peerMeasured))};
}

double secondsNow()
{
    return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

}  // namespace typhon::bench
