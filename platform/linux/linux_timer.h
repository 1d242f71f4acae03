#pragma once

#include "platform/linux/timer_service.h"
#include "platform/work_queues.h"

#include <functional>
#include <memory>

namespace typhon {

/// A timer of the timer service whose handler is posted to a queue.
class LinuxTimer final : public Timer {
public:
    LinuxTimer(std::shared_ptr<TimerService> service, WorkQueue& queue, std::function<void()> handler);
    ~LinuxTimer() override;

    void schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway) override;
    void cancel() override;

private:
    struct State;
    const std::shared_ptr<TimerService> service_;
    const std::shared_ptr<State> state_;
};

}  // namespace typhon
