#include "platform/linux/linux_timer.h"

#include <mutex>
#include <optional>
#include <utility>

namespace typhon {

/// Shared with the pending call, which may begin while the timer is being re-armed, cancelled or destroyed:
/// it posts the handler only if it still belongs to the latest arming.
struct LinuxTimer::State {
    State(WorkQueue& target, std::function<void()> function) : queue(target), handler(std::move(function)) {}

    void fire(std::uint64_t arming)
    {
        const std::lock_guard lock(mutex);
        if (armed && arming == armings) {
            armed = false;
            queue.async(handler);
        }
    }

    WorkQueue& queue;
    const std::function<void()> handler;
    std::mutex mutex;
    // Protected by mutex.
    bool armed = false;
    std::uint64_t armings = 0;
    std::optional<TimerService::Key> pending;
};

LinuxTimer::LinuxTimer(std::shared_ptr<TimerService> service, WorkQueue& queue, std::function<void()> handler)
    : service_(std::move(service)), state_(std::make_shared<State>(queue, std::move(handler)))
{}

LinuxTimer::~LinuxTimer()
{
    cancel();
}

void LinuxTimer::schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway)
{
    const std::lock_guard lock(state_->mutex);
    if (state_->pending) {
        service_->cancel(*state_->pending);
    }
    state_->armed = true;
    state_->pending = service_->schedule(
        delay, leeway, [state = state_, arming = ++state_->armings] { state->fire(arming); });
}

void LinuxTimer::cancel()
{
    const std::lock_guard lock(state_->mutex);
    state_->armed = false;
    if (state_->pending) {
        service_->cancel(*std::exchange(state_->pending, std::nullopt));
    }
}

}  // namespace typhon
