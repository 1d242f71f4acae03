#pragma once

#include "platform/background_activity.h"
#include "platform/clock.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"
#include "platform/work_queues.h"

#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace typhon {

/// When an activity runs.
struct ActivityCriteria {
    double intervalSeconds = 24 * 60 * 60;
    /// Whether it may run while the machine is on battery.
    bool allowsBattery = false;
};

/// True when one of the machine's batteries is being discharged.
bool isOnBattery(const RootDirectory& root);

/// Background activities by timers of this process. The criteria are read from
/// /etc/typhon/activities.d/<name>.plist when an activity is registered; the time of its last run is kept
/// beside the preferences, so that a restart does not bring the next one forward. Any thread.
class LinuxBackgroundActivities final : public BackgroundActivities {
public:
    struct Services {
        WorkQueues& queues;
        Clock& clock;
        Log& log;
        /// A number in [0, 1), to spread the runs of many machines.
        std::function<double()> random;
    };

    LinuxBackgroundActivities(Services services, RootDirectory root);
    ~LinuxBackgroundActivities() override;

    void registerActivity(const std::string& name, Handler handler) override;

private:
    class Registered;
    const Services services_;
    const RootDirectory root_;
    const std::shared_ptr<WorkQueue> queue_;
    std::mutex mutex_;
    // Protected by mutex_.
    std::vector<std::shared_ptr<Registered>> activities_;
};

}  // namespace typhon
