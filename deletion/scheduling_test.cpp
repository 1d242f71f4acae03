// What scheduling records, and with which delay.

#include "deletion/deletion_fixture.h"

#include <cmath>
#include <limits>

namespace typhon::test {
namespace {

const std::string fontPath = fontFiles + "com.example.provider/a.ttf";
const std::string assetPath = fontAssets + "abc.asset/a.ttf";

class Scheduling : public DeletionTest {
protected:
    /// The delay that a path scheduled now gets.
    double delay()
    {
        schedule({fontPath});
        return remaining(fontPath);
    }
    double delayWith(PropertyList chosen)
    {
        setDelay(std::move(chosen));
        return delay();
    }
};

TEST_F(Scheduling, AnEmptyArrayReadsNothingAndWritesNothing)
{
    schedule({});
    EXPECT_EQ(simulated.preferences.writes(), 0U);
    EXPECT_EQ(simulated.preferences.synchronizes(), 0U);
    advance(1e6);
    EXPECT_EQ(passes(), 0U);
}

TEST_F(Scheduling, PathsInBothTreesAreRecordedWithOneDateAndFlushed)
{
    schedule({fontPath, assetPath});
    const auto entries = scheduled();
    ASSERT_EQ(entries.size(), 2U);
    EXPECT_EQ(entries.at(fontPath), entries.at(assetPath));
    EXPECT_EQ(remaining(fontPath), 10800);
    EXPECT_EQ(simulated.preferences.synchronizes(), 1U);
}

TEST_F(Scheduling, PathsOutsideBothTreesAreSkippedInSilence)
{
    schedule({"/etc/passwd", "", "FontFiles/a.ttf", "/var/mobile/Library/UserFonts/FontFiles", fontPath,
              "/var/mobile/Library/UserFonts/FontFilesX/a.ttf", assetStore + "abc.asset/AssetData/a.ttf",
              "/var/mobile/Library/Fonts/Managed/a.ttf", "/private" + fontPath});
    EXPECT_EQ(scheduled().size(), 1U);
    EXPECT_TRUE(simulated.log.entries().empty());
}

TEST_F(Scheduling, OnlyPathsOutsideBothTreesRewriteTheScheduleUnchangedAndStillArm)
{
    setSchedule({{fontPath, dueIn(50)}});
    const auto before = scheduled();
    schedule({"/etc/passwd"});
    EXPECT_EQ(scheduled(), before);
    EXPECT_EQ(simulated.preferences.writes(), 1U);
    EXPECT_EQ(simulated.preferences.synchronizes(), 1U);
    advance(16200);
    EXPECT_EQ(passes(), 1U);
}

TEST_F(Scheduling, TheTestForATreeIsThePlainPrefix)
{
    const auto hostile = fontFiles + "../../../etc/passwd";
    schedule({hostile, fontFiles});
    EXPECT_TRUE(scheduled().contains(hostile));
    EXPECT_TRUE(scheduled().contains(fontFiles));
}

TEST_F(Scheduling, AScheduleThatIsNoDictionaryIsEmpty)
{
    simulated.preferences.changeFromOutside("delete", PropertyList("everything"));
    schedule({fontPath});
    EXPECT_EQ(scheduled().size(), 1U);
}

TEST_F(Scheduling, TheMostRecentSchedulingCountsEvenWhenItIsEarlier)
{
    schedule({fontPath});
    EXPECT_EQ(remaining(fontPath), 10800);
    setDelay(300);
    schedule({fontPath});
    EXPECT_EQ(remaining(fontPath), 300);
    setDelay(20000.0);
    schedule({fontPath});
    EXPECT_EQ(remaining(fontPath), 20000);
}

TEST_F(Scheduling, TheDefaultDelayIsThreeHoursAndTenMinutesOnAnInternalBuild)
{
    EXPECT_EQ(delay(), 10800);
    simulated.platform.isInternalBuild = true;
    EXPECT_EQ(delay(), 600);
}

TEST_F(Scheduling, ADelayThatIsNoNumberAboveZeroIsTheDefault)
{
    EXPECT_EQ(delayWith(-5), 10800);
    EXPECT_EQ(delayWith(0), 10800);
    EXPECT_EQ(delayWith(std::nan("")), 10800);
    EXPECT_EQ(delayWith("20"), 10800);
    EXPECT_EQ(delayWith(true), 10800);
    EXPECT_EQ(delayWith(PropertyList(Dictionary{})), 10800);
}

TEST_F(Scheduling, ADelayIsTruncatedToWholeSecondsThatFit32Bits)
{
    EXPECT_EQ(delayWith(20.99), 20);
    EXPECT_EQ(delayWith(7), 7);
    EXPECT_EQ(delayWith(0.5), 0);
    EXPECT_EQ(delayWith(4294967295.9), 4294967295.0);
    EXPECT_EQ(delayWith(4294967296.0), 4294967295.0);
    EXPECT_EQ(delayWith(std::int64_t{1} << 62), 4294967295.0);
    EXPECT_EQ(delayWith(std::numeric_limits<double>::infinity()), 4294967295.0);
}

TEST_F(Scheduling, AFullScheduleTakesNoMoreAndSaysSoOnce)
{
    Dictionary entries;
    for (std::size_t i = 0; i < DeletionSchedule::mostEntries - 1; ++i) {
        entries.emplace(fontFiles + std::to_string(i), dueIn(1e6));
    }
    setSchedule(std::move(entries));
    schedule({fontPath, assetPath, fontPath + "2"});
    EXPECT_EQ(scheduled().size(), DeletionSchedule::mostEntries);
    EXPECT_TRUE(scheduled().contains(fontPath));
    setDelay(300);
    schedule({assetPath, fontPath});
    EXPECT_EQ(remaining(fontPath), 300) << "what is scheduled can still be scheduled anew";
    EXPECT_EQ(simulated.log.countContaining("the deletion schedule is full: of 3 font files, 2 are not"), 1U);
    EXPECT_EQ(simulated.log.countContaining("is full"), 1U);
}

TEST_F(Scheduling, LongPathsFillTheScheduleSooner)
{
    const std::string letters(DeletionSchedule::mostBytes / 4, 'x');
    schedule({fontFiles + letters + "1", fontFiles + letters + "2", fontFiles + letters + "3"});
    EXPECT_EQ(scheduled().size(), 3U);
    schedule({fontFiles + letters + "\xc3\xa9", fontFiles + letters, fontPath});
    EXPECT_EQ(scheduled().size(), 4U) << "text that is not ASCII takes up to twice the room";
    EXPECT_TRUE(scheduled().contains(fontPath));
    EXPECT_EQ(simulated.log.countContaining("is full"), 1U);
}

Task<void> scheduleThen(std::shared_ptr<ScheduledFontDeletion> deletion, std::vector<std::string> paths,
                        unsigned* ended)
{
    auto scheduling = deletion->scheduleFontFilesDeletion(std::move(paths));
    co_await std::move(scheduling);
    ++*ended;
}

Task<void> holdUntil(std::shared_ptr<Semaphore> gate)
{
    auto turn = gate->wait();
    co_await std::move(turn);
}

TEST_F(Scheduling, TheDelayIsTakenBeforeTheTurnOfTheRecordingTheDateInIt)
{
    const auto gate = simulated.queues.createSemaphore(0);
    auto& queue = deletion->scheduledFontDeletionQueue();
    EXPECT_EQ(queue.label(), "com.vorlan.typhond.scheduledFontDeletion");
    EXPECT_EQ(&queue, &deletion->scheduledFontDeletionQueue());
    queue.async(holdUntil(gate));
    setDelay(300);
    schedule({fontPath});
    setDelay(500);
    EXPECT_EQ(scheduled().size(), 0U);
    advance(100);
    gate->signal();
    simulated.drain();
    EXPECT_EQ(remaining(fontPath), 300);
}

TEST_F(Scheduling, WhoSchedulesALotWaitsForItsTurn)
{
    const auto gate = simulated.queues.createSemaphore(0);
    deletion->scheduledFontDeletionQueue().async(holdUntil(gate));
    std::vector<std::shared_ptr<WorkQueue>> clients;
    unsigned ended = 0;
    for (int client = 0; client < 50; ++client) {
        clients.push_back(simulated.queues.createSerialQueue("client"));
        const auto path = fontFiles + std::to_string(client) + ".ttf";
        clients.back()->async(scheduleThen(deletion, {path}, &ended));
    }
    simulated.drain();
    EXPECT_EQ(ended, 32U);
    EXPECT_EQ(scheduled().size(), 0U);
    gate->signal();
    simulated.drain();
    EXPECT_EQ(ended, 50U);
    EXPECT_EQ(scheduled().size(), 50U);
}

}  // namespace
}  // namespace typhon::test
