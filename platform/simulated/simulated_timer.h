#pragma once

#include "platform/simulated/simulated_scheduler.h"
#include "platform/work_queues.h"

#include <algorithm>
#include <functional>
#include <optional>
#include <utility>

namespace typhon {

/// A timer in virtual time.
class SimulatedTimer final : public Timer {
public:
    SimulatedTimer(SimulatedScheduler& scheduler, WorkQueue& queue, std::function<void()> handler)
        : scheduler_(scheduler), queue_(queue), handler_(std::move(handler))
    {}
    ~SimulatedTimer() override { disarm(); }

    void schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway) override
    {
        disarm();
        const auto window = static_cast<std::uint64_t>(std::max<std::int64_t>(leeway.count(), 0));
        const auto within = std::chrono::nanoseconds(scheduler_.pick(window + 1));
        delay = std::max(delay, std::chrono::nanoseconds::zero());
        pending_ = scheduler_.schedule(delay + within, [this] {
            pending_.reset();
            queue_.async(handler_);
        });
    }
    void cancel() override { disarm(); }

private:
    void disarm()
    {
        if (pending_) {
            scheduler_.cancel(*std::exchange(pending_, std::nullopt));
        }
    }

    SimulatedScheduler& scheduler_;
    WorkQueue& queue_;
    const std::function<void()> handler_;
    std::optional<SimulatedScheduler::Key> pending_;
};

}  // namespace typhon
