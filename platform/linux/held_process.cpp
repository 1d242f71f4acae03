// Opening a process takes as long as all the rest of a look at it, and most looks are at a process that was
// looked at a moment ago. So the last ones stay open: their number is bounded, since each costs three
// descriptors. An entry cannot go stale: pidfd and /proc descriptors belong to one process for good, and when
// it has ended they answer nothing, even if its number names another process by then.

#include "platform/linux/held_process.h"

#include "platform/linux/bounded_cache.h"
#include "platform/linux/exec_generation.h"
#include "platform/linux/pidfd.h"

#include <mutex>
#include <string>
#include <utility>

#include <fcntl.h>

namespace typhon {

namespace {

using Key = std::pair<std::int32_t, std::uint64_t>;

/// Of the whole daemon, as the descriptors are.
struct Kept {
    std::mutex mutex;
    BoundedCache<Key, std::shared_ptr<const HeldProcess>> processes{maximumHeldProcesses};
};

Kept& kept()
{
    static Kept processes;
    return processes;
}

Key keyOf(const AuditToken& token)
{
    return {token.processIdentifier, token.processInstance};
}

std::shared_ptr<const HeldProcess> openProcess(const AuditToken& token)
{
    auto pidfd = openPidfd(token.processIdentifier);
    if (!pidfd || (kernelHasProcessInodes() && inodeOfPidfd(pidfd.get()) != token.processInstance)) {
        return nullptr;
    }
    const auto path = "/proc/" + std::to_string(token.processIdentifier);
    FileDescriptor directory(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!directory || (!kernelHasProcessInodes() && startTime(directory.get()) != token.processInstance)) {
        return nullptr;
    }
    FileDescriptor status(::openat(directory.get(), "status", O_RDONLY | O_CLOEXEC));
    return std::make_shared<const HeldProcess>(
        HeldProcess{std::move(pidfd), std::move(directory), std::move(status)});
}

}  // namespace

std::shared_ptr<const HeldProcess> holdProcess(const AuditToken& token)
{
    if (token.processIdentifier <= 0 || token.processInstance == 0 || token.execGeneration == 0 ||
        token.bootEpoch != bootEpoch()) {
        return nullptr;
    }
    {
        auto& [mutex, processes] = kept();
        const std::lock_guard lock(mutex);
        if (auto known = processes.find(keyOf(token))) {
            return *std::move(known);
        }
    }
    return openProcess(token);
}

void keepProcess(const AuditToken& token, const std::shared_ptr<const HeldProcess>& process)
{
    auto& [mutex, processes] = kept();
    const std::lock_guard lock(mutex);
    if (processes.find(keyOf(token)) != process) {
        processes.store(keyOf(token), process);
    }
}

void releaseProcess(const AuditToken& token)
{
    auto& [mutex, processes] = kept();
    const std::lock_guard lock(mutex);
    processes.erase(keyOf(token));
}

}  // namespace typhon
