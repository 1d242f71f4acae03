#include "simulation/daemon_simulation.h"
#include "simulation/invariants.h"
#include "simulation/request_simulation.h"

#include <algorithm>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

// Canaries: for each invariant a daemon that breaks it, through the services that it stands on. Who watches
// has to say so, by the invariant's name.

namespace typhon::simulation {
namespace {

constexpr std::uint64_t seedsForACanary = 60;

using Simulation = Findings (*)(std::uint64_t seed, Defect defect);

/// In how many of the runs that invariant is reported broken, in words that contain `saying`.
std::size_t runsThatBreak(const Invariant& invariant, Defect defect, Simulation simulate = simulateDaemon,
                          const std::string& saying = {})
{
    std::size_t count = 0;
    for (std::uint64_t seed = 1; seed <= seedsForACanary; ++seed) {
        const auto findings = simulate(seed, defect);
        const auto name = std::string(invariant.name) + ": ";
        count += std::ranges::any_of(findings.violations,
                                     [&](const auto& violation) {
                                         return violation.starts_with(name) &&
                                                violation.find(saying) != std::string::npos;
                                     })
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

TEST(Invariants, ADaemonThatAnswersRequestsTwiceIsCaught)
{
    EXPECT_GT(runsThatBreak(invariants::oneAnswer, Defect::answersTwice, simulateRequests), 0U);
}

TEST(Invariants, ADaemonThatForgetsToOpenTheGateHasLostIt)
{
    EXPECT_GT(runsThatBreak(invariants::oneAtATime, Defect::losesTheGate, simulateRequests,
                            "requests never get their turn"),
              0U);
}

TEST(Invariants, ADaemonThatOpensTheGateTwiceIsSeenToLetTwoRequestsThrough)
{
    for (const auto* seen :
         {"two requests at once", "a dialog while another one is up", "lets 2 through instead of one"}) {
        EXPECT_GT(runsThatBreak(invariants::oneAtATime, Defect::opensTheGateTwice, simulateRequests, seen),
                  0U)
            << seen;
    }
}

}  // namespace
}  // namespace typhon::simulation
