#include "simulation/request_simulation.h"

#include "simulation/requesting_application.h"
#include "simulation/simulated_user.h"

#include <chrono>

// The steps of a run are spread over a virtual minute, in which requests pause and wait for each other. The
// gate is watched from outside after every single step of the scheduler: two turns begin at least a second
// apart, and no dialog comes up while another one waits. In the end the user answers whatever is still up;
// then every request must have come to its one end, and the gate must let exactly one through.

namespace typhon::simulation {

namespace {

using namespace std::chrono_literals;

constexpr std::uint64_t stepsOfARun = 80;
constexpr std::chrono::nanoseconds durationOfARun = 60s;

/// Sees turns begin, by the report that each sends, and dialogs come up.
class GateWatch {
public:
    GateWatch(World& world, const SimulatedUser& user) : world_(world), user_(user) {}

    void look()
    {
        const auto& simulated = world_.simulated;
        const auto now = simulated.scheduler.uptime();
        if (simulated.analytics.offered() != turns_) {
            if (simulated.analytics.offered() != turns_ + 1 || (turns_ != 0 && now - lastBegin_ < 1s)) {
                world_.report(invariants::oneAtATime, "the gate", "two requests at once");
            }
            turns_ = simulated.analytics.offered();
            lastBegin_ = now;
        }
        for (; dialogs_ < user_.dialogs(); ++dialogs_) {
            if (dialogs_ != 0 && !user_.hasAnswered(dialogs_ - 1)) {
                world_.report(invariants::oneAtATime, "the gate", "a dialog while another one is up");
            }
        }
    }
    std::size_t turns() const { return turns_; }

private:
    World& world_;
    const SimulatedUser& user_;
    std::size_t turns_ = 0;
    std::chrono::nanoseconds lastBegin_{0};
    std::size_t dialogs_ = 0;
};

class Run {
public:
    Run(std::uint64_t seed, Defect defect) : world_(seed, defect) {}

    Findings findings()
    {
        startUp(*world_.daemon);
        for (std::uint64_t step = 0; step < stepsOfARun; ++step) {
            world_.simulated.scheduler.schedule(std::chrono::nanoseconds(pick(durationOfARun.count())),
                                                [this] { takeStep(); });
        }
        pass(durationOfARun);
        finishRequests();
        judge();
        leave();
        return {world_.violations, world_.simulated.log.text()};
    }

private:
    std::uint64_t pick(std::uint64_t bound) { return world_.simulated.scheduler.pick(bound); }

    void takeStep()
    {
        const auto what = pick(20);
        if (what < 2) {
            changeRegistry();
        } else if (what == 2) {
            world_.simulated.remoteAlerts.setDefinitionClassAvailable(pick(4) != 0);
        } else if (what == 3) {
            world_.simulated.userFontManager.failNext("out of order");
        } else if (what < 8) {
            user_.act();
        } else if (what < 12 || applications_.empty()) {
            const auto& kinds = clientKinds();
            // Mostly those who may ask for fonts.
            const auto& kind = kinds[pick(2) == 0 ? pick(6) : pick(kinds.size())];
            applications_.push_back(std::make_unique<RequestingApplication>(world_, history_, kind));
            applications_.back()->act();
        } else {
            applications_[pick(applications_.size())]->act();
        }
    }

    void changeRegistry()
    {
        for (auto count = 1 + pick(6); count != 0; --count) {
            world_.registry.changeSomething();
        }
        auto& daemon = *world_.daemon;
        daemon.mainHandlerQueue().async([&daemon] { daemon.userFontRegistry().invalidateUserFonts(); });
    }

    /// Lets that much time pass, under the eyes of the watch.
    void pass(std::chrono::nanoseconds time)
    {
        bool isOver = false;
        auto& scheduler = world_.simulated.scheduler;
        scheduler.schedule(time, [&isOver] { isOver = true; });
        while (!isOver) {
            scheduler.stepThroughTime();
            watch_.look();
        }
        while (scheduler.step()) {
            watch_.look();
        }
    }

    std::int32_t inFlight() const { return world_.daemon->fontRequests().gate().inFlight(); }

    void finishRequests()
    {
        for (std::uint64_t round = 0; round < 2 * stepsOfARun && inFlight() != 0; ++round) {
            user_.answerWhatIsUp();
            pass(1s);
        }
        if (inFlight() != 0) {
            world_.report(invariants::oneAtATime, "the gate",
                          std::to_string(inFlight()) + " requests never get their turn");
        }
    }

    static Task<void> passGate(Platform* platform, int* passed)
    {
        auto waiting = platform->requestGate.semaphore().wait();
        co_await std::move(waiting);
        ++*passed;
    }

    void judge()
    {
        for (const auto& application : applications_) {
            application->judgeOutcomes();
        }
        int passed = 0;
        const auto first = world_.simulated.queues.createSerialQueue("first at the gate");
        const auto second = world_.simulated.queues.createSerialQueue("second at the gate");
        first->async(passGate(&world_.services->platform, &passed));
        second->async(passGate(&world_.services->platform, &passed));
        world_.simulated.drain();
        if (passed != 1) {
            world_.report(invariants::oneAtATime, "the gate",
                          "lets " + std::to_string(passed) + " through instead of one");
        }
        world_.services->platform.requestGate.semaphore().signal();
        world_.simulated.drain();
        world_.expectNone(invariants::oneAtATime, "lost gates", 2U - static_cast<unsigned>(passed));
    }

    void leave()
    {
        for (const auto& application : applications_) {
            application->disconnect();
        }
        user_.leave();
        world_.simulated.drain();
        world_.judgeTheEnd();
    }

    World world_;
    RequestHistory history_;
    SimulatedUser user_{world_, history_};
    GateWatch watch_{world_, user_};
    std::vector<std::unique_ptr<RequestingApplication>> applications_;
};

}  // namespace

Findings simulateRequests(std::uint64_t seed, Defect defect)
{
    return Run(seed, defect).findings();
}

}  // namespace typhon::simulation
