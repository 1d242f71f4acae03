#include "sdk/waiting.h"

#include "sdk/client_errors.h"

#include <algorithm>
#include <cerrno>
#include <limits>

namespace typhon {

Deadline deadlineAfter(const std::optional<std::chrono::milliseconds>& timeout)
{
    if (!timeout) {
        return std::nullopt;
    }
    constexpr std::chrono::milliseconds longest = std::chrono::hours(24 * 365);
    return std::chrono::steady_clock::now() + std::min(*timeout, longest);
}

ClientResult<bool> waitFor(std::vector<pollfd> descriptors, const Deadline& deadline)
{
    int milliseconds = -1;
    if (deadline) {
        const auto left =
            std::chrono::ceil<std::chrono::milliseconds>(*deadline - std::chrono::steady_clock::now());
        milliseconds =
            static_cast<int>(std::clamp<std::int64_t>(left.count(), 0, std::numeric_limits<int>::max()));
    }
    const int outcome = ::poll(descriptors.data(), descriptors.size(), milliseconds);
    if (outcome < 0 && errno != EINTR) {
        return systemError(errno, "cannot wait");
    }
    return outcome > 0;
}

}  // namespace typhon
