#pragma once

#include <algorithm>
#include <chrono>
#include <iterator>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// Tells removed applications from those that are merely being replaced: one that is missing for a whole
/// window was removed. One thread.
class RemovalTracker {
public:
    using Time = std::chrono::steady_clock::time_point;

    explicit RemovalTracker(std::chrono::nanoseconds window) : window_(window) {}

    /// Takes what is installed at `now`, and gives what was removed: each identifier once, until it is
    /// installed again. What was never installed is never removed.
    std::vector<std::string> saw(const std::set<std::string>& installed, Time now)
    {
        for (const auto& identifier : installed) {
            missing_.erase(identifier);
        }
        std::vector<std::string> removed;
        for (auto known = known_.begin(); known != known_.end();) {
            const bool isGone = !installed.contains(*known) && isDue(*known, now);
            if (isGone) {
                removed.push_back(*known);
                missing_.erase(*known);
            }
            known = isGone ? known_.erase(known) : std::next(known);
        }
        known_.insert(installed.begin(), installed.end());
        return removed;
    }

    /// When the next removal is certain, if nothing changes; null when nothing is missing.
    std::optional<Time> nextDue() const
    {
        std::optional<Time> next;
        for (const auto& [identifier, due] : missing_) {
            next = next ? std::min(*next, due) : due;
        }
        return next;
    }

private:
    bool isDue(const std::string& identifier, Time now)
    {
        return missing_.try_emplace(identifier, now + window_).first->second <= now;
    }

    const std::chrono::nanoseconds window_;
    std::set<std::string> known_;
    /// When each missing one counts as removed.
    std::map<std::string, Time> missing_;
};

}  // namespace typhon
