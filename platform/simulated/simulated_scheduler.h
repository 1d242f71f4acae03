#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <random>
#include <unordered_map>
#include <utility>
#include <vector>

namespace typhon {

/// The one thread and the one time of a simulated machine. Whatever could happen next in any order happens
/// in an order that the seed decides: the same seed gives the same run. Virtual time stands still while
/// anything can run. Outlives the services that use it; not for use from several threads.
class SimulatedScheduler {
public:
    using Job = std::function<void()>;
    using Duration = std::chrono::nanoseconds;
    /// Names a scheduled job. Never used again.
    using Key = std::pair<std::int64_t, std::uint64_t>;

    explicit SimulatedScheduler(std::uint64_t seed);
    SimulatedScheduler(const SimulatedScheduler&) = delete;
    SimulatedScheduler& operator=(const SimulatedScheduler&) = delete;
    ~SimulatedScheduler();

    std::uint64_t seed() const { return seed_; }
    std::mt19937_64& random() { return random_; }
    /// A number in [0, bound), the same on every standard library; `bound` is above zero.
    std::uint64_t pick(std::uint64_t bound) { return random_() % bound; }
    bool flipCoin() { return pick(2) == 0; }

    /// Runs `job` some time, after the jobs that were posted to the same `lane` before, in any order with
    /// those of other lanes. A lane is anything with an address.
    void post(Job job) { post(this, std::move(job)); }
    void post(const void* lane, Job job);
    /// Posts `job` in virtual time, `delay` from now (a negative one counts as zero).
    Key schedule(Duration delay, Job job);
    /// Forgets a scheduled job, if its time has not come.
    void cancel(const Key& key);

    /// Runs one job that can run now. False if there is none.
    bool step();
    /// Runs the next job of `lane`. False if there is none.
    bool stepLane(const void* lane);
    /// Runs one job, after virtual time has gone on to the next scheduled one if nothing else is left to do.
    /// False if nothing at all is left.
    bool stepThroughTime();
    /// Runs all that can run at the present virtual time.
    void runUntilIdle();
    /// Runs all that can run, with virtual time going on by `duration`: scheduled jobs run in the order of
    /// their times, each with all that follows from it.
    void advance(Duration duration);
    /// Runs until `predicate` holds, with virtual time going on whenever nothing else is left to do. False
    /// if nothing at all is left and it still does not hold.
    bool runUntil(const std::function<bool()>& predicate);

    /// Virtual time since boot.
    Duration uptime() const { return Duration(now_); }
    /// Virtual seconds since the Unix epoch.
    double wallClock() const;
    /// Moves the wall clock, and nothing else, forwards or backwards.
    void stepWallClock(double seconds) { wallClockOffset_ += seconds; }

private:
    using Lane = std::deque<Job>;

    bool isDue() const { return !scheduled_.empty() && scheduled_.begin()->first.first <= now_; }
    void runDue();
    void runFrontOf(std::size_t index);
    /// Moves time to the first scheduled job, if that is at `limit` or before.
    bool moveOn(std::int64_t limit);

    const std::uint64_t seed_;
    std::mt19937_64 random_;
    std::int64_t now_;
    double wallClockOffset_;
    std::uint64_t lastNumber_ = 0;
    std::map<Key, Job> scheduled_;
    std::unordered_map<const void*, Lane> lanes_;
    /// The lanes that have jobs, in an order that depends on the run only, never on addresses.
    std::vector<const void*> ready_;
};

}  // namespace typhon
