// Pending calls sorted by due time, and one timerfd set to the first of them. With a leeway, the due time is
// put on the next multiple of the largest power of two that fits into the leeway: calls with similar windows
// then share one moment and one wake-up.

#include "platform/linux/timer_service.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <ctime>
#include <limits>
#include <system_error>
#include <vector>

#include <sys/epoll.h>
#include <sys/timerfd.h>

namespace typhon {

namespace {

constexpr std::int64_t nanosecondsPerSecond = 1'000'000'000;
/// About 146 years; keeps the sums below from overflowing.
constexpr std::int64_t furthest = std::numeric_limits<std::int64_t>::max() / 2;

std::int64_t bootTime()
{
    timespec now{};
    clock_gettime(CLOCK_BOOTTIME, &now);
    return now.tv_sec * nanosecondsPerSecond + now.tv_nsec;
}

std::int64_t dueTime(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway)
{
    const std::int64_t due = bootTime() + std::clamp<std::int64_t>(delay.count(), 0, furthest / 2);
    const std::int64_t window = std::clamp<std::int64_t>(leeway.count(), 0, furthest / 2);
    if (window == 0) {
        return due;
    }
    const auto step = static_cast<std::int64_t>(std::bit_floor(static_cast<std::uint64_t>(window)));
    return (due + step - 1) / step * step;
}

}  // namespace

class TimerService::State : public std::enable_shared_from_this<TimerService::State> {
public:
    State() : descriptor_(timerfd_create(CLOCK_BOOTTIME, TFD_NONBLOCK | TFD_CLOEXEC))
    {
        if (!descriptor_) {
            throw std::system_error(errno, std::generic_category(), "timerfd_create");
        }
    }

    void start(EventPool& pool)
    {
        // Weak: the handler may be called while the service is being destroyed.
        watch_ = pool.watch(descriptor_.get(), [weak = weak_from_this()](std::uint32_t) {
            if (const auto state = weak.lock()) {
                state->callDue();
            }
        });
        watch_->arm(EPOLLIN);
    }

    Key add(std::int64_t due, std::function<void()> function)
    {
        const std::lock_guard lock(mutex_);
        const Key key{due, ++lastNumber_};
        if (!closed_) {
            calls_.emplace(key, std::move(function));
            setTimer();
        }
        return key;
    }

    void remove(const Key& key)
    {
        std::unique_lock lock(mutex_);
        const auto removed = calls_.extract(key);
        lock.unlock();
    }

    void close()
    {
        std::unique_lock lock(mutex_);
        closed_ = true;
        const auto dropped = std::exchange(calls_, {});
        lock.unlock();
    }

private:
    static constexpr std::int64_t never = std::numeric_limits<std::int64_t>::max();

    void callDue()
    {
        std::vector<std::function<void()>> due;
        {
            const std::lock_guard lock(mutex_);
            std::uint64_t expirations = 0;
            (void)!::read(descriptor_.get(), &expirations, sizeof expirations);
            const auto end = calls_.upper_bound({bootTime(), std::numeric_limits<std::uint64_t>::max()});
            for (auto call = calls_.begin(); call != end; call = calls_.erase(call)) {
                due.push_back(std::move(call->second));
            }
            setAt_ = never;
            setTimer();
        }
        // Before the next event, which another thread might handle: what is due earlier is called earlier.
        for (auto& function : due) {
            function();
        }
        watch_->arm(EPOLLIN);
    }

    /// A timer left over from a call that was cancelled is not taken back: it finds nothing due.
    void setTimer()
    {
        const std::int64_t first = calls_.empty() ? never : calls_.begin()->first.first;
        if (first >= setAt_) {
            return;
        }
        setAt_ = first;
        itimerspec value{};
        value.it_value.tv_sec = first / nanosecondsPerSecond;
        value.it_value.tv_nsec = first % nanosecondsPerSecond;
        timerfd_settime(descriptor_.get(), TFD_TIMER_ABSTIME, &value, nullptr);
    }

    const FileDescriptor descriptor_;
    std::unique_ptr<EventPool::Watch> watch_;
    std::mutex mutex_;
    // Protected by mutex_.
    std::map<Key, std::function<void()>> calls_;
    std::uint64_t lastNumber_ = 0;
    std::int64_t setAt_ = never;
    bool closed_ = false;
};

TimerService::TimerService(EventPool& pool) : state_(std::make_shared<State>())
{
    state_->start(pool);
}

TimerService::~TimerService()
{
    state_->close();
}

TimerService::Key TimerService::schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway,
                                         std::function<void()> function)
{
    return state_->add(dueTime(delay, leeway), std::move(function));
}

void TimerService::cancel(const Key& key)
{
    state_->remove(key);
}

void TimerService::close()
{
    state_->close();
}

}  // namespace typhon
