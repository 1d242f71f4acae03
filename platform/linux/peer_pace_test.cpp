#include "platform/linux/peer_pace.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;
using std::chrono::nanoseconds;

class PeerPaceTest : public testing::Test {
protected:
    static AuditToken process(std::int32_t identifier)
    {
        AuditToken token{};
        token.processIdentifier = identifier;
        return token;
    }

    PeerPace::Moment now = PeerPace::Moment() + 1h;
    PeerPace pace{{.allowance = 100ms, .oneIn = 10, .connection = 1ms, .longestRest = 3s}};
};

TEST_F(PeerPaceTest, WhatIsAllowedAtOnceIsFree)
{
    EXPECT_EQ(pace.rest(process(1), 60ms, now), 0ns);
    EXPECT_EQ(pace.rest(process(1), 40ms, now), 0ns);
}

TEST_F(PeerPaceTest, WhoTakesMoreRestsUntilItHasTakenItsPart)
{
    pace.rest(process(1), 100ms, now);
    EXPECT_EQ(pace.rest(process(1), 1ms, now), 10ms);
    now += 10ms;
    EXPECT_EQ(pace.rest(process(1), 2ms, now), 20ms);
}

TEST_F(PeerPaceTest, TimeGivesTheAllowanceBack)
{
    pace.rest(process(1), 100ms, now);
    now += 500ms;
    EXPECT_EQ(pace.rest(process(1), 50ms, now), 0ns);
    EXPECT_EQ(pace.rest(process(1), 1ms, now), 10ms);
}

TEST_F(PeerPaceTest, NoRestIsLongerThanTheLongest)
{
    EXPECT_EQ(pace.rest(process(1), 1h, now), 3s);
    EXPECT_EQ(pace.rest(process(1), 1h, now), 3s);
    now += 3s;
    EXPECT_EQ(pace.rest(process(1), 1ms, now), 10ms);
}

TEST_F(PeerPaceTest, ProcessesRestForThemselvesOnly)
{
    pace.rest(process(1), 1s, now);
    EXPECT_EQ(pace.rest(process(2), 1ms, now), 0ns);
    auto successor = process(1);
    successor.processInstance = 7;
    EXPECT_EQ(pace.rest(successor, 1ms, now), 0ns);
}

TEST_F(PeerPaceTest, ConnectionsCount)
{
    for (int count = 0; count < 100; ++count) {
        EXPECT_EQ(pace.restAfterConnecting(process(1), now), 0ns);
    }
    EXPECT_EQ(pace.restAfterConnecting(process(1), now), 10ms);
}

TEST_F(PeerPaceTest, RestedProcessesAreForgotten)
{
    for (std::int32_t identifier = 0; identifier < 10'000; ++identifier) {
        pace.rest(process(identifier), 1ms, now);
        now += 1ms;
    }
    EXPECT_LT(pace.count(), 200U);
}

TEST_F(PeerPaceTest, WithoutAnAllowanceNobodyRests)
{
    PeerPace unlimited{PaceLimits{}};
    EXPECT_EQ(unlimited.rest(process(1), 1h, now), 0ns);
    EXPECT_EQ(unlimited.count(), 0U);
}

}  // namespace
}  // namespace typhon
