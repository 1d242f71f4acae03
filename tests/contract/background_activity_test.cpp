#include "platform/linux/linux_background_activities.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_background_activities.h"
#include "platform/simulated/simulated_clock.h"
#include "platform/simulated/simulated_log.h"
#include "platform/simulated/simulated_work_queues.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using States = std::vector<std::int64_t>;
constexpr auto checkIn = background_activity_states::checkIn;
constexpr auto run = background_activity_states::run;
const std::string frequent = "org.example.frequent";
const std::string rare = "org.example.rare";

/// The background activities of one system, where `frequent` and `rare` may be registered.
class Subject {
public:
    virtual ~Subject() = default;
    virtual BackgroundActivities& activities() = 0;
    /// Lets happen what happens before anything is due.
    virtual void settle() = 0;
    /// `frequent` becomes due once, `rare` does not.
    virtual void frequentBecomesDue() = 0;
};

class SimulatedSubject final : public Subject {
public:
    BackgroundActivities& activities() override { return activities_; }
    void settle() override { scheduler_.runUntilIdle(); }
    void frequentBecomesDue() override
    {
        activities_.call(frequent, run);
        settle();
    }

private:
    SimulatedScheduler scheduler_{1};
    SimulatedBackgroundActivities activities_{scheduler_};
};

/// The Linux service in virtual time, which it reaches through the queues and the clock alone.
class LinuxSubject final : public Subject {
public:
    LinuxSubject()
    {
        register_(frequent, "1000");
        register_(rare, "10000000");
    }
    BackgroundActivities& activities() override { return activities_; }
    void settle() override { scheduler_.runUntilIdle(); }
    void frequentBecomesDue() override
    {
        // The middle of its spread after the registration, and then that much after each interval.
        scheduler_.advance(std::exchange(untilNext_, std::chrono::seconds(1050)));
    }

private:
    void register_(const std::string& name, const std::string& interval)
    {
        scratch_.writeFile("/etc/typhon/activities.d/" + name + ".plist",
                           "<plist version=\"1.0\"><dict><key>Interval</key><integer>" + interval +
                               "</integer></dict></plist>");
    }

    ScratchDirectory scratch_;
    SimulatedScheduler scheduler_{1};
    SimulatedWorkQueues queues_{scheduler_};
    SimulatedClock clock_{scheduler_};
    SimulatedLog log_;
    std::chrono::seconds untilNext_{100};
    LinuxBackgroundActivities activities_{
        {.queues = queues_, .clock = clock_, .log = log_, .random = [] { return 0.5; }},
        RootDirectory(scratch_.path())};
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class BackgroundActivityContract : public testing::TestWithParam<Implementation> {
protected:
    void register_(const std::string& name, States& states)
    {
        subject->activities().registerActivity(
            name, [&states](const BackgroundActivity& activity) { states.push_back(activity.state()); });
    }

    States first;
    States second;
    const std::unique_ptr<Subject> subject = GetParam().make();
};

TEST_P(BackgroundActivityContract, RegisteringReturnsBeforeTheHandlerIsCalled)
{
    register_(frequent, first);
    EXPECT_EQ(first, States{});
    subject->settle();
    EXPECT_EQ(first, States{checkIn});
}

TEST_P(BackgroundActivityContract, AnActivityChecksInOnceAndRunsWheneverItIsDue)
{
    register_(frequent, first);
    subject->settle();
    EXPECT_EQ(first, States{checkIn});
    subject->frequentBecomesDue();
    EXPECT_EQ(first, (States{checkIn, run}));
    subject->frequentBecomesDue();
    subject->frequentBecomesDue();
    EXPECT_EQ(first, (States{checkIn, run, run, run}));
}

TEST_P(BackgroundActivityContract, ActivitiesRunApartFromEachOther)
{
    register_(rare, first);
    register_(frequent, second);
    subject->settle();
    subject->frequentBecomesDue();
    EXPECT_EQ(first, States{checkIn});
    EXPECT_EQ(second, (States{checkIn, run}));
}

INSTANTIATE_TEST_SUITE_P(, BackgroundActivityContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
