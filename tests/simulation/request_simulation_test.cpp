#include "simulation/request_simulation.h"
#include "simulation/seeds.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon::simulation {
namespace {

TEST(RequestSimulation, EveryRequestIsAnsweredOnceWithItsShareAndTheGateLetsOneThroughAtATime)
{
    for (const auto seed : seeds()) {
        const auto findings = simulateRequests(seed);
        EXPECT_THAT(findings.violations, testing::IsEmpty())
            << "seed " << seed << "; replay it with --seed " << seed << "\n"
            << findings.log;
        if (HasFailure()) {
            return;
        }
    }
}

TEST(RequestSimulation, ASeedReplays)
{
    const auto seed = seeds().front();
    EXPECT_EQ(simulateRequests(seed).log, simulateRequests(seed).log) << "seed " << seed;
}

}  // namespace
}  // namespace typhon::simulation
