#pragma once

#include "sdk/client_result.h"

#include <chrono>
#include <optional>
#include <vector>

#include <poll.h>

namespace typhon {

/// A point in time until which to wait; null: for ever.
using Deadline = std::optional<std::chrono::steady_clock::time_point>;

Deadline deadlineAfter(const std::optional<std::chrono::milliseconds>& timeout);

/// Waits until one of the descriptors is ready. False when the time is over, or a signal handler ran.
ClientResult<bool> waitFor(std::vector<pollfd> descriptors, const Deadline& deadline);

}  // namespace typhon
