#include "simulation/deletion_simulation.h"
#include "simulation/seeds.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon::simulation {
namespace {

TEST(DeletionSimulation, FilesGoWhenTheyAreDueAndNothingElseEverGoes)
{
    for (const auto seed : seeds()) {
        const auto findings = simulateDeletion(seed);
        EXPECT_THAT(findings.violations, testing::IsEmpty())
            << "seed " << seed << "; replay it with --seed " << seed << "\n"
            << findings.log;
        if (HasFailure()) {
            return;
        }
    }
}

}  // namespace
}  // namespace typhon::simulation
