#include "platform/linux/linux_semaphore.h"

#include <utility>

namespace typhon {

void LinuxSemaphore::enter(State& state, std::function<void()> done)
{
    {
        const std::lock_guard lock(state.mutex);
        if (state.count == 0) {
            state.waiters.push_back(std::move(done));
            return;
        }
        --state.count;
    }
    done();
}

Task<void> LinuxSemaphore::waitOn(std::shared_ptr<State> state)
{
    std::function<void(std::function<void()>)> begin = [state](std::function<void()> done) {
        enter(*state, std::move(done));
    };
    co_await awaitCompletion<void>(std::move(begin));
}

Task<void> LinuxSemaphore::wait()
{
    return waitOn(state_);
}

void LinuxSemaphore::signal()
{
    const auto state = state_;
    std::function<void()> next;
    {
        const std::lock_guard lock(state->mutex);
        if (state->waiters.empty()) {
            ++state->count;
            return;
        }
        next = std::move(state->waiters.front());
        state->waiters.pop_front();
    }
    next();
}

}  // namespace typhon
