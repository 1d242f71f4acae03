#include "platform/linux/descriptor_headroom.h"

#include <algorithm>

#include <sys/resource.h>

namespace typhon {

bool isWithinDescriptorHeadroom(int newest)
{
    constexpr rlim_t mostKept = 128;
    rlimit limit{};
    if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) {
        return false;
    }
    // The system gives out the lowest number that is free, so all below the newest are taken.
    const auto kept = std::min(mostKept, limit.rlim_cur / 4);
    return static_cast<rlim_t>(newest) >= limit.rlim_cur - kept;
}

}  // namespace typhon
