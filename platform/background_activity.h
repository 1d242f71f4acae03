#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace typhon {

/// Where an activity stands when its handler is called.
namespace background_activity_states {
/// The activity has just been registered: not to be done yet.
inline constexpr std::int64_t checkIn = 0;
/// It is to be done now.
inline constexpr std::int64_t run = 2;
}  // namespace background_activity_states

/// A call of an activity's handler. Lives as long as the call.
class BackgroundActivity {
public:
    virtual ~BackgroundActivity() = default;
    virtual std::int64_t state() const = 0;
};

/// Work that the system has done now and then, when it suits. Any thread.
class BackgroundActivities {
public:
    using Handler = std::function<void(const BackgroundActivity& activity)>;

    virtual ~BackgroundActivities() = default;
    /// Registers an activity in check-in mode: its interval and criteria are what the service registration
    /// says under that name. The handler is called once in the check-in state, then in the run state whenever
    /// the activity is due, for the life of the process, on a thread of the system's own, and returns soon.
    virtual void registerActivity(const std::string& name, Handler handler) = 0;
};

}  // namespace typhon
