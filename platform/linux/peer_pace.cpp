#include "platform/linux/peer_pace.h"

#include <algorithm>

namespace typhon {

using std::chrono::nanoseconds;

/// What an account comes to after the time that went by.
nanoseconds PeerPace::takenBy(const Account& account, Moment now) const
{
    const nanoseconds since = std::max(now - account.until, Moment::duration::zero());
    return std::max(account.taken - since / limits_.oneIn, nanoseconds::zero());
}

nanoseconds PeerPace::rest(const AuditToken& peer, nanoseconds taken, Moment now)
{
    if (!isLimited() || taken <= nanoseconds::zero()) {
        return {};
    }
    const std::lock_guard lock(mutex_);
    forgetRested(now);
    auto& account = accounts_[{peer.processIdentifier, peer.processInstance}];
    const auto longest = limits_.allowance + limits_.longestRest / limits_.oneIn;
    account = {std::min(takenBy(account, now) + taken, longest), now};
    return std::max(account.taken - limits_.allowance, nanoseconds::zero()) * limits_.oneIn;
}

/// Now and then, so that it costs next to nothing each time. The caller locks.
void PeerPace::forgetRested(Moment now)
{
    if (accounts_.size() < nextForgetting_) {
        return;
    }
    std::erase_if(accounts_,
                  [&](const auto& entry) { return takenBy(entry.second, now) == nanoseconds::zero(); });
    nextForgetting_ = 64 + 2 * accounts_.size();
}

std::size_t PeerPace::count() const
{
    const std::lock_guard lock(mutex_);
    return accounts_.size();
}

}  // namespace typhon
