#pragma once

#include "platform/platform.h"
#include "platform/task.h"

#include <cstdint>
#include <string>

namespace typhon {

/// Lets one font request at a time through, system-wide and in the order in which they came, since each may
/// put a dialog before the user. Its state is the process's, not this object's. Any thread.
class RequestGate {
public:
    /// `platform` outlives this, and all work that passes the gate.
    explicit RequestGate(Platform& platform) : platform_(platform) {}

    /// Suspends the running item until it is this request's turn. Says so in the log when another request is
    /// in flight. There is no time limit: a dialog that nobody answers keeps the gate closed.
    Task<void> enter(std::string signingIdentifier);

    /// The end of a request's turn: holds the running item for a second, then opens the gate from the main
    /// queue. Once for each `enter`.
    Task<void> leave();

    /// Requests that were admitted or wait.
    std::int32_t inFlight() const { return platform_.requestGate.inFlight; }

private:
    Platform& platform_;
};

}  // namespace typhon
