#include "platform/simulated/simulated_platform.h"
#include "requests/request_counters.h"

#include <limits>

#include <gtest/gtest.h>

namespace typhon {
namespace {

class RequestCountersTest : public testing::Test {
protected:
    std::optional<PropertyList> stored(const std::string& key) const
    {
        return simulated.preferences.durableValue(key);
    }

    SimulatedPlatform simulated;
    RequestCounters counters{simulated.preferences};
};

TEST_F(RequestCountersTest, NothingToCountTouchesNothing)
{
    counters.recordRequestFontsResultWihtMissed(false, false);
    EXPECT_EQ(simulated.preferences.writes(), 0U);
    EXPECT_EQ(simulated.preferences.synchronizes(), 0U);
}

TEST_F(RequestCountersTest, EachFlagCountsForItselfAndIsFlushed)
{
    counters.recordRequestFontsResultWihtMissed(true, false);
    EXPECT_EQ(stored("missed"), PropertyList(1));
    EXPECT_EQ(stored("resolved"), std::nullopt);
    counters.recordRequestFontsResultWihtMissed(true, true);
    EXPECT_EQ(stored("missed"), PropertyList(2));
    EXPECT_EQ(stored("resolved"), PropertyList(1));
    EXPECT_EQ(simulated.preferences.synchronizes(), 2U);
}

TEST_F(RequestCountersTest, ExtractingGivesBothCountsAndSetsThemToZero)
{
    counters.recordRequestFontsResultWihtMissed(false, true);
    const auto counts = counters.extractRequestFontsMissed();
    EXPECT_EQ(counts.missed, 0);
    EXPECT_EQ(counts.resolved, 1);
    EXPECT_EQ(stored("missed"), PropertyList(0));
    EXPECT_EQ(stored("resolved"), PropertyList(0));
}

TEST_F(RequestCountersTest, ExtractingNothingWritesNothing)
{
    const auto counts = counters.extractRequestFontsMissed();
    EXPECT_EQ(counts.missed + counts.resolved, 0);
    EXPECT_EQ(simulated.preferences.writes(), 0U);
    EXPECT_EQ(simulated.preferences.synchronizes(), 0U);
}

TEST_F(RequestCountersTest, CountsThatSomebodySpoiledStartAnewAndStopAtTheLargest)
{
    simulated.preferences.changeFromOutside("missed", "many");
    simulated.preferences.changeFromOutside("resolved", std::numeric_limits<std::int64_t>::max());
    counters.recordRequestFontsResultWihtMissed(true, true);
    EXPECT_EQ(stored("missed"), PropertyList(1));
    EXPECT_EQ(stored("resolved"), PropertyList(std::numeric_limits<std::int64_t>::max()));
}

}  // namespace
}  // namespace typhon
