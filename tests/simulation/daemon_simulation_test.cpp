#include "simulation/daemon_simulation.h"
#include "simulation/seeds.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon::simulation {
namespace {

TEST(DaemonSimulation, NoClientEverGetsMoreThanItsShareAndEveryCallComesToOneEnd)
{
    for (const auto seed : seeds()) {
        const auto findings = simulateDaemon(seed);
        EXPECT_THAT(findings.violations, testing::IsEmpty())
            << "seed " << seed << "; replay it with --seed " << seed << "\n"
            << findings.log;
        if (HasFailure()) {
            return;
        }
    }
}

TEST(DaemonSimulation, ASeedReplays)
{
    const auto seed = seeds().front();
    EXPECT_EQ(simulateDaemon(seed).log, simulateDaemon(seed).log) << "seed " << seed;
}

}  // namespace
}  // namespace typhon::simulation
