#pragma once

#include "platform/audit_token.h"
#include "platform/log.h"

#include <chrono>
#include <cstdint>
#include <map>
#include <mutex>
#include <set>
#include <string>
#include <tuple>

namespace typhon {

/// Logs what is refused or closed because of a peer's behaviour: each kind of offence once for each process,
/// and no more than so many lines a minute for each user, whose processes may be many. Any thread.
class OffenderLog {
public:
    explicit OffenderLog(Log& log) : log_(log) {}

    /// `kind` tells offences apart; `message` is logged, unless it was before.
    void report(const AuditToken& peer, const std::string& kind, const std::string& message)
    {
        const std::lock_guard lock(mutex_);
        if (seen_.size() >= remembered) {
            seen_.clear();
        }
        if (!seen_.insert({peer.processIdentifier, peer.processInstance, kind}).second) {
            return;
        }
        auto& window = windows_[peer.effectiveUser];
        const auto now = std::chrono::steady_clock::now();
        if (now - window.start > std::chrono::minutes(1)) {
            window = {now, 0};
        }
        if (++window.lines < linesAMinute) {
            TYLog_Error(log_, message);
        } else if (window.lines == linesAMinute) {
            TYLog_Error(log_, message + "; more of this of user " + std::to_string(peer.effectiveUser) +
                                  " is not logged for a minute");
        }
    }

private:
    static constexpr std::size_t remembered = 4096;
    static constexpr unsigned linesAMinute = 32;
    struct Window {
        std::chrono::steady_clock::time_point start;
        unsigned lines = 0;
    };

    Log& log_;
    std::mutex mutex_;
    std::set<std::tuple<std::int32_t, std::uint64_t, std::string>> seen_;
    std::map<std::uint32_t, Window> windows_;
};

}  // namespace typhon
