#include "tools/relayd/rate_limit.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

int admittedAt(RateLimit& limit, RateLimit::Time time, int events)
{
    int admitted = 0;
    for (int event = 0; event < events; ++event) {
        admitted += limit.admits(time) ? 1 : 0;
    }
    return admitted;
}

TEST(RateLimit, AdmitsOneSecondsWorthInABurst)
{
    RateLimit limit(10);
    EXPECT_EQ(admittedAt(limit, RateLimit::Time(seconds(100)), 50), 10);
}

TEST(RateLimit, AdmitsMoreAsTimePasses)
{
    RateLimit limit(10);
    const RateLimit::Time start{seconds(100)};
    admittedAt(limit, start, 50);
    EXPECT_EQ(admittedAt(limit, start + milliseconds(50), 50), 0);
    EXPECT_EQ(admittedAt(limit, start + milliseconds(500), 50), 5);
}

TEST(RateLimit, SavesNoMoreThanOneBurst)
{
    RateLimit limit(10);
    const RateLimit::Time start{seconds(100)};
    admittedAt(limit, start, 50);
    EXPECT_EQ(admittedAt(limit, start + seconds(3600), 50), 10);
}

}  // namespace
}  // namespace typhon
