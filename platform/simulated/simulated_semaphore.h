#pragma once

#include "platform/work_queues.h"

#include <deque>
#include <functional>
#include <memory>
#include <utility>

namespace typhon {

/// A semaphore whose waiters are suspended items.
class SimulatedSemaphore final : public Semaphore {
public:
    explicit SimulatedSemaphore(unsigned initialCount) : state_(std::make_shared<State>())
    {
        state_->count = initialCount;
    }

    Task<void> wait() override { return waitOn(state_); }
    void signal() override
    {
        if (state_->waiters.empty()) {
            ++state_->count;
            return;
        }
        const auto next = std::move(state_->waiters.front());
        state_->waiters.pop_front();
        next();
    }

private:
    struct State {
        unsigned count = 0;
        std::deque<std::function<void()>> waiters;
    };

    static Task<void> waitOn(std::shared_ptr<State> state)
    {
        std::function<void(std::function<void()>)> begin = [state](std::function<void()> done) {
            if (state->count == 0) {
                state->waiters.push_back(std::move(done));
            } else {
                --state->count;
                done();
            }
        };
        co_await awaitCompletion<void>(std::move(begin));
    }

    const std::shared_ptr<State> state_;
};

}  // namespace typhon
