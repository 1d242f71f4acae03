#include "platform/simulated/simulated_scheduler.h"

#include <algorithm>
#include <limits>

namespace typhon {

namespace {

constexpr std::int64_t bootTime = 1'000'000'000;
constexpr double firstWallClock = 1'700'000'000.0;
/// Keeps the sums of times from overflowing.
constexpr std::int64_t furthest = std::numeric_limits<std::int64_t>::max() / 4;

}  // namespace

SimulatedScheduler::SimulatedScheduler(std::uint64_t seed)
    : seed_(seed), random_(seed), now_(bootTime), wallClockOffset_(firstWallClock)
{}

SimulatedScheduler::~SimulatedScheduler()
{
    // What dropped jobs let go of may post and schedule some more.
    while (!lanes_.empty() || !scheduled_.empty()) {
        const auto lanes = std::exchange(lanes_, {});
        const auto scheduled = std::exchange(scheduled_, {});
        ready_.clear();
    }
}

void SimulatedScheduler::post(const void* lane, Job job)
{
    Lane& jobs = lanes_[lane];
    if (jobs.empty()) {
        ready_.push_back(lane);
    }
    jobs.push_back(std::move(job));
}

SimulatedScheduler::Key SimulatedScheduler::schedule(Duration delay, Job job)
{
    const Key key{now_ + std::clamp<std::int64_t>(delay.count(), 0, furthest), ++lastNumber_};
    scheduled_.emplace(key, std::move(job));
    return key;
}

void SimulatedScheduler::cancel(const Key& key)
{
    const auto dropped = scheduled_.extract(key);
}

bool SimulatedScheduler::step()
{
    const std::size_t choices = ready_.size() + (isDue() ? 1 : 0);
    if (choices == 0) {
        return false;
    }
    const auto choice = static_cast<std::size_t>(pick(choices));
    if (choice == ready_.size()) {
        runDue();
    } else {
        runFrontOf(choice);
    }
    return true;
}

bool SimulatedScheduler::stepLane(const void* lane)
{
    const auto place = std::find(ready_.begin(), ready_.end(), lane);
    if (place == ready_.end()) {
        return false;
    }
    runFrontOf(static_cast<std::size_t>(place - ready_.begin()));
    return true;
}

bool SimulatedScheduler::stepThroughTime()
{
    return step() || (moveOn(std::numeric_limits<std::int64_t>::max()) && step());
}

void SimulatedScheduler::runDue()
{
    const auto due = scheduled_.extract(scheduled_.begin());
    due.mapped()();
}

void SimulatedScheduler::runFrontOf(std::size_t index)
{
    const auto lane = lanes_.find(ready_[index]);
    const Job job = std::move(lane->second.front());
    lane->second.pop_front();
    if (lane->second.empty()) {
        lanes_.erase(lane);
        ready_[index] = ready_.back();
        ready_.pop_back();
    }
    job();
}

bool SimulatedScheduler::moveOn(std::int64_t limit)
{
    if (scheduled_.empty() || scheduled_.begin()->first.first > limit) {
        return false;
    }
    now_ = std::max(now_, scheduled_.begin()->first.first);
    return true;
}

void SimulatedScheduler::runUntilIdle()
{
    while (step()) {
    }
}

void SimulatedScheduler::advance(Duration duration)
{
    const std::int64_t end = now_ + std::clamp<std::int64_t>(duration.count(), 0, furthest);
    do {
        runUntilIdle();
    } while (moveOn(end));
    now_ = std::max(now_, end);
}

bool SimulatedScheduler::runUntil(const std::function<bool()>& predicate)
{
    while (!predicate()) {
        if (!stepThroughTime()) {
            return false;
        }
    }
    return true;
}

double SimulatedScheduler::wallClock() const
{
    return wallClockOffset_ + static_cast<double>(now_ - bootTime) * 1e-9;
}

}  // namespace typhon
