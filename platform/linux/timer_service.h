#pragma once

#include "platform/linux/event_pool.h"
#include "platform/linux/file_descriptor.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <utility>

namespace typhon {

/// Calls functions at moments of the boot clock: one timerfd, watched by the pool, for any number of them.
/// Any thread.
class TimerService {
public:
    /// Names a pending call. Never used again.
    using Key = std::pair<std::int64_t, std::uint64_t>;

    explicit TimerService(EventPool& pool);
    /// Calls no more, and drops the functions. A call that runs at present goes on.
    ~TimerService();

    /// Calls `function` once on a pool thread, within [delay, delay + leeway] from now (a negative one counts
    /// as zero). The function has to be short. Calls whose windows overlap tend to be made together.
    Key schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway,
                 std::function<void()> function);
    /// Forgets the call, if it has not begun.
    void cancel(const Key& key);
    /// Forgets all calls and takes no more.
    void close();

private:
    class State;
    std::shared_ptr<State> state_;
};

}  // namespace typhon
