#pragma once

#include "platform/audit_token.h"

#include <chrono>
#include <cstdint>
#include <map>
#include <mutex>
#include <utility>

namespace typhon {

/// How much of our time a process may take by sending faster than it is answered.
struct PaceLimits {
    /// What it may take at once; zero for no limit at all.
    std::chrono::nanoseconds allowance{};
    /// In the long run, one part in so many of what time goes by.
    unsigned oneIn = 50;
    /// What one more connection counts for.
    std::chrono::nanoseconds connection = std::chrono::microseconds(250);
    /// It is left unread no longer than that at a time.
    std::chrono::nanoseconds longestRest = std::chrono::seconds(2);
};

/// Keeps what processes take of our time. One that takes more than its part is read again only when it has
/// rested: its socket fills meanwhile, and it has to wait, while others find the processor free. Any thread.
class PeerPace {
public:
    using Moment = std::chrono::steady_clock::time_point;

    explicit PeerPace(PaceLimits limits) : limits_(limits) {}

    /// `peer` has taken that much time, until `now`. How long to leave it alone from now on, mostly zero.
    std::chrono::nanoseconds rest(const AuditToken& peer, std::chrono::nanoseconds taken, Moment now);
    std::chrono::nanoseconds restAfterConnecting(const AuditToken& peer, Moment now)
    {
        return rest(peer, limits_.connection, now);
    }
    bool isLimited() const { return limits_.allowance.count() > 0; }
    /// Processes that have taken any time of late.
    std::size_t count() const;

private:
    struct Account {
        std::chrono::nanoseconds taken{};
        Moment until;
    };
    using ProcessKey = std::pair<std::int32_t, std::uint64_t>;

    std::chrono::nanoseconds takenBy(const Account& account, Moment now) const;
    void forgetRested(Moment now);

    const PaceLimits limits_;
    mutable std::mutex mutex_;
    std::map<ProcessKey, Account> accounts_;
    std::size_t nextForgetting_ = 64;
};

}  // namespace typhon
