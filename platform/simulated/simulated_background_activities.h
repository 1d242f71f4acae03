#pragma once

#include "platform/background_activity.h"
#include "platform/simulated/simulated_scheduler.h"

#include <map>
#include <string>
#include <utility>

namespace typhon {

/// Background activities that check in by themselves, and come due when a test says so. One thread.
class SimulatedBackgroundActivities final : public BackgroundActivities {
public:
    explicit SimulatedBackgroundActivities(SimulatedScheduler& scheduler) : scheduler_(scheduler) {}

    void registerActivity(const std::string& name, Handler handler) override
    {
        scheduler_.post(this, [handler] { handler(Call(background_activity_states::checkIn)); });
        handlers_.insert_or_assign(name, std::move(handler));
    }

    bool isRegistered(const std::string& name) const { return handlers_.contains(name); }
    /// Calls the handler of a registered activity in that state.
    void call(const std::string& name, std::int64_t state) const { handlers_.at(name)(Call(state)); }

private:
    class Call final : public BackgroundActivity {
    public:
        explicit Call(std::int64_t state) : state_(state) {}
        std::int64_t state() const override { return state_; }

    private:
        const std::int64_t state_;
    };

    SimulatedScheduler& scheduler_;
    std::map<std::string, Handler> handlers_;
};

}  // namespace typhon
