#include "simulation/daemon_simulation.h"
#include "simulation/invariants.h"

#include <algorithm>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

// Canaries: for each invariant a daemon that breaks it, through the services that it stands on. Who watches
// has to say so, by the invariant's name.

namespace typhon::simulation {
namespace {

constexpr std::uint64_t seedsForACanary = 60;

/// In how many of the runs that invariant is reported broken.
std::size_t runsThatBreak(const Invariant& invariant, Defect defect)
{
    std::size_t count = 0;
    for (std::uint64_t seed = 1; seed <= seedsForACanary; ++seed) {
        const auto findings = simulateDaemon(seed, defect);
        const auto name = std::string(invariant.name) + ": ";
        count += std::ranges::any_of(findings.violations,
                                     [&](const auto& violation) { return violation.starts_with(name); })
                     ? 1
                     : 0;
    }
    testing::Test::RecordProperty("runs", static_cast<int>(count));
    return count;
}

TEST(Invariants, ADaemonThatConfusesProcessesGivesThemMoreThanTheirShare)
{
    EXPECT_GT(runsThatBreak(invariants::share, Defect::confusesProcesses), 0U);
}

TEST(Invariants, ADaemonThatAnswersTwiceIsCaught)
{
    EXPECT_GT(runsThatBreak(invariants::oneAnswer, Defect::answersTwice), 0U);
}

TEST(Invariants, ADaemonThatTrustsAnOldRegistryRecordsWhatIsNotRegistered)
{
    EXPECT_GT(runsThatBreak(invariants::registered, Defect::trustsAnOldRegistry), 0U);
}

TEST(Invariants, ADaemonThatPretendsToFlushHasLostItsLedgerAfterARestart)
{
    EXPECT_GT(runsThatBreak(invariants::flushed, Defect::pretendsToFlush), 0U);
}

TEST(Invariants, ADaemonThatHoldsOnToWhatItMadeForItsClientsLeaksIt)
{
    EXPECT_GT(runsThatBreak(invariants::nothingLeaks, Defect::keepsHandlers), 0U);
}

}  // namespace
}  // namespace typhon::simulation
