#pragma once

#include "platform/work_queues.h"

#include <deque>
#include <functional>
#include <memory>
#include <mutex>

namespace typhon {

/// A semaphore whose waiters are suspended items.
class LinuxSemaphore final : public Semaphore {
public:
    explicit LinuxSemaphore(unsigned initialCount) : state_(std::make_shared<State>(initialCount)) {}

    Task<void> wait() override;
    void signal() override;

private:
    struct State {
        explicit State(unsigned initialCount) : count(initialCount) {}
        std::mutex mutex;
        // Protected by mutex.
        unsigned count;
        std::deque<std::function<void()>> waiters;
    };
    static void enter(State& state, std::function<void()> done);
    static Task<void> waitOn(std::shared_ptr<State> state);

    /// Shared with the waiters: a signal may let one go on that destroys the semaphore.
    const std::shared_ptr<State> state_;
};

}  // namespace typhon
