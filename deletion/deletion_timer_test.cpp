// When passes run: arming, stopping, restarting.

#include "deletion/deletion_fixture.h"

namespace typhon::test {
namespace {

const std::string first = fontFiles + "com.example.provider/first.ttf";
const std::string second = fontFiles + "com.example.provider/second.ttf";

class DeletionTimer : public DeletionTest {
protected:
    /// Seconds until the next pass has run.
    double untilNextPass()
    {
        const auto start = simulated.clock.uptime();
        const auto before = passes();
        EXPECT_TRUE(simulated.scheduler.runUntil([&] { return passes() > before; }));
        simulated.drain();
        return std::chrono::duration<double>(simulated.clock.uptime() - start).count();
    }
};

TEST_F(DeletionTimer, TheTimerFiresAQuarterLaterWithinAnotherQuarter)
{
    schedule({file(first)});
    advance(13499.999);
    EXPECT_EQ(passes(), 0U);
    advance(16200 - 13499.999);
    EXPECT_EQ(passes(), 1U);
    EXPECT_FALSE(exists(first));
}

TEST_F(DeletionTimer, TheWindowIsUsedAndKeptWhateverTheSeed)
{
    double earliest = 1e9;
    double latest = 0;
    for (std::uint64_t seed = 1; seed <= 200; ++seed) {
        SimulatedPlatform other(seed);
        const auto armed = std::make_shared<ScheduledFontDeletion>(other.platform, [] {});
        armed->setFontFilesDeletionTimer(10800);
        other.drain();
        const auto start = other.clock.uptime();
        ASSERT_TRUE(other.scheduler.runUntil(
            [&] { return other.log.countContaining("executeScheduledFontFilesDeletion") != 0; }));
        const auto waited = std::chrono::duration<double>(other.clock.uptime() - start).count();
        earliest = std::min(earliest, waited);
        latest = std::max(latest, waited);
    }
    EXPECT_GE(earliest, 13500);
    EXPECT_LE(latest, 16200);
    EXPECT_LT(earliest, 13700);
    EXPECT_GT(latest, 16000);
}

TEST_F(DeletionTimer, ADelayOfAFractionIsDueAndDeletedAtOnce)
{
    setDelay(0.5);
    schedule({file(first)});
    EXPECT_EQ(passes(), 1U);
    EXPECT_FALSE(exists(first));
}

TEST_F(DeletionTimer, TheLongestDelayDoesNotWrapAround)
{
    deletion->setFontFilesDeletionTimer(4294967295U);
    simulated.drain();
    // The platform's timers reach no further than this, which no machine runs without a restart.
    constexpr double seventyYears = 70.0 * 365 * 86400;
    EXPECT_GE(untilNextPass(), seventyYears);
}

TEST_F(DeletionTimer, TheSecondBatchWaitsForTheNextStartOfTheDaemon)
{
    const auto close = file(fontFiles + "com.example.provider/close.ttf");
    setDelay(1000);
    schedule({file(first)});
    advance(60);
    schedule({close});
    advance(840);
    schedule({file(second)});
    const auto fired = 900 + untilNextPass();
    EXPECT_GE(fired, 1250) << "the first batch's timer is as it was";
    EXPECT_LE(fired, 1500);
    EXPECT_FALSE(exists(first));
    EXPECT_FALSE(exists(close));
    EXPECT_TRUE(exists(second));
    const auto left = static_cast<std::uint32_t>(1900 - fired);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "next deletion after " + std::to_string(left) + " seconds."))
        << simulated.log.text();

    advance(1e6);
    EXPECT_EQ(passes(), 1U) << "the fired timer is held, and nothing arms it";
    EXPECT_TRUE(exists(second));
    EXPECT_EQ(scheduled().size(), 1U);

    restart();
    EXPECT_EQ(passes(), 2U);
    EXPECT_FALSE(exists(second));
    EXPECT_TRUE(scheduled().empty());
}

TEST_F(DeletionTimer, ASecondBatchThatIsNotDueWhenTheFirstOnesTimerFiresWaitsForTheNextStart)
{
    schedule({file(first)});
    advance(10'000);
    schedule({file(second)});
    const auto fired = 10'000 + untilNextPass();
    EXPECT_GE(fired, 13'500);
    EXPECT_LE(fired, 16'200);
    EXPECT_FALSE(exists(first));
    EXPECT_TRUE(exists(second));
    const auto left = static_cast<std::uint32_t>(20'800 - fired);
    EXPECT_TRUE(hasLogged(LogLevel::debug, "next deletion after " + std::to_string(left) + " seconds."))
        << simulated.log.text();
    advance(1e6);
    EXPECT_EQ(passes(), 1U);
    EXPECT_TRUE(exists(second));
    restart();
    EXPECT_FALSE(exists(second));
}

TEST_F(DeletionTimer, ASecondBatchAloneWithinThreeMinutesOfItsDateGoesWithTheFirst)
{
    setDelay(1000);
    schedule({file(first)});
    advance(60);
    schedule({file(second)});
    untilNextPass();
    EXPECT_FALSE(exists(first));
    EXPECT_FALSE(exists(second));
    EXPECT_TRUE(hasLogged(LogLevel::debug, "all files deleted."));
    EXPECT_EQ(passes(), 1U);
}

TEST_F(DeletionTimer, AHeldTimerThatHasFiredIsNotArmedByANewBatch)
{
    setSchedule({{file(first), dueIn(5000)}});
    restart();
    EXPECT_EQ(passes(), 1U);
    setDelay(200);
    schedule({file(second)});
    advance(1e6);
    EXPECT_EQ(passes(), 1U);
    EXPECT_TRUE(exists(second));
}

TEST_F(DeletionTimer, AHeldTimerIsBroughtForwardByABatchWithoutDelay)
{
    setDelay(1000);
    schedule({file(first)});
    setDelay(0.5);
    schedule({file(second)});
    const auto before = passes();
    advance(60);
    EXPECT_EQ(before + passes(), before + 1);
    EXPECT_FALSE(exists(second));
    EXPECT_TRUE(exists(first));
    // Re-armed means no longer armed for the first batch.
    advance(1e6);
    EXPECT_EQ(passes(), 1U);
    EXPECT_TRUE(exists(first));
}

TEST_F(DeletionTimer, AFiredTimerIsArmedAgainByABatchWithoutDelayWithAMinutesLeeway)
{
    bool waited = false;
    for (std::uint64_t seed = 1; seed <= 30; ++seed) {
        SimulatedPlatform other(seed);
        const auto armed = std::make_shared<ScheduledFontDeletion>(other.platform, [] {});
        other.preferences.changeFromOutside("delete", PropertyList(Dictionary{{first, Date{1e12}}}));
        armed->setFontFilesDeletionTimer(0);
        other.drain();
        EXPECT_EQ(other.log.countContaining("next deletion after"), 0U) << "further away than can be told";
        EXPECT_EQ(other.log.countContaining("all files deleted."), 1U);
        armed->setFontFilesDeletionTimer(7);
        armed->setFontFilesDeletionTimer(0);
        const auto start = other.clock.uptime();
        other.scheduler.runUntil([&] { return other.log.countContaining("all files deleted.") == 2; });
        const auto seconds = std::chrono::duration<double>(other.clock.uptime() - start).count();
        EXPECT_LE(seconds, 60);
        waited = waited || seconds > 10;
    }
    EXPECT_TRUE(waited);
}

TEST_F(DeletionTimer, APassThatEmptiesTheScheduleLetsTheNextBatchArmATimer)
{
    setDelay(1000);
    schedule({file(first)});
    untilNextPass();
    EXPECT_FALSE(exists(first));
    schedule({file(second)});
    const auto waited = untilNextPass();
    EXPECT_GE(waited, 1250);
    EXPECT_LE(waited, 1500);
    EXPECT_FALSE(exists(second));
}

TEST_F(DeletionTimer, AStoppedTimerDoesNotFireAndTheNextOneIsNew)
{
    setDelay(1000);
    schedule({file(first)});
    deletion->stopFontFilesDeletionTimer();
    deletion->stopFontFilesDeletionTimer();
    advance(1e6);
    EXPECT_EQ(passes(), 0U);
    deletion->setFontFilesDeletionTimer(4);
    simulated.drain();
    const auto waited = untilNextPass();
    EXPECT_GE(waited, 5);
    EXPECT_LE(waited, 6);
}

Task<void> holdUntil(std::shared_ptr<Semaphore> gate)
{
    auto turn = gate->wait();
    co_await std::move(turn);
}

TEST_F(DeletionTimer, ATimerThatIsStoppedAfterItFiredRunsNoPass)
{
    setSchedule({{file(first), dueIn(0)}});
    deletion->setFontFilesDeletionTimer(4);
    simulated.drain();
    const auto gate = simulated.queues.createSemaphore(0);
    deletion->scheduledFontDeletionQueue().async(holdUntil(gate));
    deletion->stopFontFilesDeletionTimer();
    advance(10);
    gate->signal();
    simulated.drain();
    EXPECT_EQ(passes(), 0U);
    EXPECT_TRUE(exists(first));
}

TEST_F(DeletionTimer, StartUpWithAScheduleRunsAPassAtOnceAndKeepsWhatIsNotDue)
{
    setSchedule({{file(first), dueIn(-50)}, {file(second), dueIn(3000.7)}});
    restart();
    EXPECT_EQ(passes(), 1U);
    EXPECT_FALSE(exists(first));
    EXPECT_TRUE(exists(second));
    EXPECT_TRUE(hasLogged(LogLevel::debug, "next deletion after 3000 seconds."));
}

TEST_F(DeletionTimer, StartUpWithoutAScheduleRunsNoPass)
{
    restart();
    setSchedule({});
    restart();
    simulated.preferences.changeFromOutside("delete", PropertyList("everything"));
    restart();
    advance(1e6);
    EXPECT_EQ(passes(), 0U);
    EXPECT_EQ(sweeps, 3U);
}

TEST_F(DeletionTimer, TheSweepStartsOnceAStartAndNotOnTheStartUpsThread)
{
    deletion->setupForScheduledFontDeletion();
    EXPECT_EQ(sweeps, 0U);
    simulated.drain();
    EXPECT_EQ(sweeps, 1U);
}

TEST_F(DeletionTimer, AScheduleSurvivesTheDaemon)
{
    schedule({file(first)});
    restart();
    EXPECT_TRUE(exists(first));
    EXPECT_EQ(scheduled().size(), 1U);
    advance(10800 - 179);
    EXPECT_TRUE(exists(first)) << "nothing has armed a timer again";
    restart();
    EXPECT_FALSE(exists(first));
}

TEST_F(DeletionTimer, TheWallClockDecidesWhatIsDueTheBootClockWhenAPassRuns)
{
    schedule({file(first)});
    simulated.scheduler.stepWallClock(-86400);
    advance(16200);
    EXPECT_EQ(passes(), 1U);
    EXPECT_TRUE(exists(first)) << "a day further away again";
    simulated.scheduler.stepWallClock(2 * 86400);
    advance(1e5);
    EXPECT_EQ(passes(), 1U);
    restart();
    EXPECT_FALSE(exists(first));
}

}  // namespace
}  // namespace typhon::test
