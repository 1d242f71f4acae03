#include "platform/linux/linux_background_activities.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/scratch_directory.h"
#include "testing/manual_queues.h"

#include <chrono>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;
using testing::ManualQueues;

class ManualClock final : public Clock {
public:
    double now() const override { return seconds; }
    std::chrono::nanoseconds uptime() const override { return 0ns; }
    double seconds = 1'000'000;
};

class LinuxBackgroundActivitiesTest : public ::testing::Test {
protected:
    std::unique_ptr<LinuxBackgroundActivities> start()
    {
        states.clear();
        auto activities = std::make_unique<LinuxBackgroundActivities>(
            LinuxBackgroundActivities::Services{
                .queues = queues, .clock = clock, .log = log, .random = [this] { return random; }},
            RootDirectory(scratch.path()));
        activities->registerActivity("org.example.check", [this](const BackgroundActivity& activity) {
            states.push_back(activity.state());
        });
        return activities;
    }
    void register_(const std::string& interval, const std::string& allowsBattery)
    {
        scratch.writeFile("/etc/typhon/activities.d/org.example.check.plist",
                          "<plist version=\"1.0\"><dict><key>Interval</key><integer>" + interval +
                              "</integer><key>AllowBattery</key><" + allowsBattery + "/></dict></plist>");
    }
    void discharge(const std::string& status)
    {
        scratch.writeFile("/sys/class/power_supply/BAT0/type", "Battery\n");
        scratch.writeFile("/sys/class/power_supply/BAT0/status", status + "\n");
    }

    ScratchDirectory scratch;
    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    ManualQueues queues;
    ManualClock clock;
    double random = 0.5;
    std::vector<std::int64_t> states;
    const std::vector<std::int64_t> checkedIn{background_activity_states::checkIn};
    const std::vector<std::int64_t> hasRun{background_activity_states::checkIn,
                                           background_activity_states::run};
};

TEST_F(LinuxBackgroundActivitiesTest, ChecksInFirstAndRunsWhenItIsDue)
{
    register_("1000", "false");
    const auto activities = start();
    EXPECT_EQ(states, checkedIn);
    EXPECT_NEAR(queues.armedFor, 50, 0.01) << "never ran: within a tenth of the interval";
    queues.fire();
    EXPECT_EQ(states, hasRun);
    EXPECT_NEAR(queues.armedFor, 1050, 0.01);
}

TEST_F(LinuxBackgroundActivitiesTest, TheLastRunSurvivesARestart)
{
    register_("1000", "false");
    auto activities = start();
    queues.fire();
    activities.reset();
    clock.seconds += 300;
    activities = start();
    EXPECT_EQ(states, checkedIn);
    EXPECT_NEAR(queues.armedFor, 750, 0.01);
}

TEST_F(LinuxBackgroundActivitiesTest, ALastRunInTheFutureCountsAsNow)
{
    register_("1000", "false");
    auto activities = start();
    queues.fire();
    activities.reset();
    clock.seconds -= 500'000;
    activities = start();
    EXPECT_NEAR(queues.armedFor, 1050, 0.01);
}

TEST_F(LinuxBackgroundActivitiesTest, IsPutOffOnBatteryUnlessItIsAllowedThere)
{
    register_("1000", "false");
    discharge("Discharging");
    auto activities = start();
    queues.fire();
    EXPECT_EQ(states, checkedIn);
    EXPECT_NEAR(queues.armedFor, 50, 0.01);
    discharge("Charging");
    queues.fire();
    EXPECT_EQ(states, hasRun);
    discharge("Discharging");
    register_("1000", "true");
    activities = start();
    queues.fire();
    EXPECT_EQ(states, hasRun);
}

TEST_F(LinuxBackgroundActivitiesTest, TheBatteryOfADeviceIsNotTheMachines)
{
    discharge("Discharging");
    EXPECT_TRUE(isOnBattery(RootDirectory(scratch.path())));
    scratch.writeFile("/sys/class/power_supply/BAT0/scope", "Device\n");
    EXPECT_FALSE(isOnBattery(RootDirectory(scratch.path())));
}

TEST_F(LinuxBackgroundActivitiesTest, WithoutARegistrationTheIntervalIsADayAndItsBoundsHold)
{
    random = 0;
    auto activities = start();
    queues.fire();
    EXPECT_NEAR(queues.armedFor, 86'400, 0.01);
    register_("0", "false");
    activities = start();
    queues.fire();
    // That of a scratch system; elsewhere it is a minute.
    EXPECT_NEAR(queues.armedFor, 1, 0.01);
}

}  // namespace
}  // namespace typhon
