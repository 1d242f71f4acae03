#include "platform/linux/process_limits.h"

#include <csignal>

#include <malloc.h>
#include <sys/resource.h>

namespace typhon {

void prepareProcess()
{
    std::signal(SIGPIPE, SIG_IGN);
    // Otherwise the allocator learns from a first large message to keep the memory of the next ones.
    constexpr int returnedAtOnce = 256 << 10;
    ::mallopt(M_MMAP_THRESHOLD, returnedAtOnce);
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0) {
        limit.rlim_cur = limit.rlim_max;
        setrlimit(RLIMIT_NOFILE, &limit);
    }
}

}  // namespace typhon
