#include "simulation/daemon_simulation.h"

#include "platform/notifications.h"
#include "simulation/simulated_clients.h"
#include "simulation/world.h"

#include <array>
#include <chrono>

// A run is a number of steps, each of which lets one client act or changes the device, posted so that the
// scheduler mixes them with everything that the daemon does meanwhile. Every answer is judged as it arrives,
// against the most its client may have been told; then the device is left in peace, and every client that is
// still there checks in once more and must see exactly what is there. Every third daemon is killed in the
// midst of it: a second one finds what was on the disk, and lives to the end.

namespace typhon::simulation {

namespace {

constexpr std::uint64_t stepsOfARun = 120;
constexpr std::uint64_t durationOfARun = 30'000;

/// One daemon, from its start to its end.
class Life {
public:
    Life(std::uint64_t seed, Defect defect) : world_(seed, defect) { begin(); }
    Life(std::uint64_t seed, Defect defect, Life& before) : world_(seed, defect, before.world_) { begin(); }

    void live()
    {
        rest();
        while (world_.simulated.userFontManager.finishNext()) {
            rest();
        }
        settle();
        leave();
    }

    /// Lives up to some moment, and ends without a chance to do anything about it.
    void dieEarly()
    {
        bool isTime = false;
        auto& scheduler = world_.simulated.scheduler;
        scheduler.schedule(std::chrono::milliseconds(pick(durationOfARun)), [&isTime] { isTime = true; });
        while (!isTime) {
            scheduler.stepThroughTime();
        }
        for (auto steps = pick(60); steps != 0; --steps) {
            scheduler.step();
        }
        isOver_ = true;
        world_.simulated.losePower();
    }

    Findings findings() const { return {world_.violations, world_.simulated.log.text()}; }

private:
    std::uint64_t pick(std::uint64_t bound) { return world_.simulated.scheduler.pick(bound); }

    void begin()
    {
        world_.simulated.userFontManager.holdOperations();
        world_.simulated.fileSystem.setDuringRead([this](const std::string& /*path*/) {
            if (pick(20) == 0) {
                changeRegistry();
            }
        });
        startUp(*world_.daemon);
        for (std::uint64_t step = 0; step < stepsOfARun; ++step) {
            const std::chrono::milliseconds time(pick(durationOfARun));
            world_.simulated.scheduler.schedule(time, [this] {
                if (!isOver_) {
                    takeStep();
                }
            });
        }
    }

    /// Font requests pause, one after another, and who waits for a process waits for long.
    void rest() { world_.simulated.scheduler.advance(std::chrono::minutes(10)); }

    void takeStep()
    {
        const auto what = pick(24);
        if (what == 0) {
            changeRegistry();
        } else if (what < 3) {
            issueSomething();
        } else if (what == 3) {
            world_.simulated.preferences.setFailing(pick(2) == 0);
        } else if (what == 4) {
            removeApplication();
        } else if (what < 7) {
            world_.simulated.userFontManager.finishNext();
        } else if (what == 7) {
            administrate();
        } else if (what < 11 || clients_.empty()) {
            addClient();
        } else {
            clients_[pick(clients_.size())]->act();
        }
    }

    void addClient()
    {
        const auto& kinds = clientKinds();
        clients_.push_back(std::make_unique<SimulatedClient>(world_, kinds[pick(kinds.size())]));
        clients_.back()->act();
    }

    void changeRegistry()
    {
        for (auto count = 1 + pick(6); count != 0; --count) {
            world_.registry.changeSomething();
        }
        invalidate();
    }

    /// As a client's report of a change will.
    void invalidate()
    {
        auto& daemon = *world_.daemon;
        daemon.mainHandlerQueue().async([&daemon] { daemon.userFontRegistry().invalidateUserFonts(); });
    }

    void issueSomething()
    {
        const auto& kinds = clientKinds();
        const auto& kind = kinds[pick(kinds.size())];
        // Mostly to applications that can use what is issued to them.
        const auto identifier = kind.hasFontAccess || pick(4) == 0 ? kind.identifier : "com.example.reader";
        std::vector<std::string> paths;
        for (auto count = pick(4); count != 0; --count) {
            paths.push_back(world_.registry.somePath());
        }
        world_.everIssued[identifier.value_or("")].insert(paths.begin(), paths.end());
        auto& daemon = *world_.daemon;
        daemon.mainHandlerQueue().async([&daemon, paths, identifier] {
            daemon.issuedPathsLedger().recordIssuedFontPaths(paths, identifier);
        });
    }

    /// The announcement, sound or not. The font manager answers late, and now and then with an error.
    void removeApplication()
    {
        static const std::array identifiers{"com.example.reader", "com.example.provider",
                                            "com.example.other"};
        const PropertyList identifier = identifiers[pick(identifiers.size())];
        if (pick(3) == 0) {
            world_.simulated.userFontManager.failNext("out of order");
        }
        world_.simulated.notifications.deliverDistributed(
            "com.vorlan.Startwell.applicationUnregistered",
            PropertyList::Dictionary{
                {"bundleIDs", pick(6) == 0 ? identifier : PropertyList::Array{identifier}}});
    }

    void administrate()
    {
        delay_ = static_cast<std::int64_t>(1 + pick(1000));
        world_.changePreference("deleteDelay", *delay_);
    }

    void settle()
    {
        world_.simulated.fileSystem.setDuringRead(nullptr);
        world_.registry.repair();
        invalidate();
        world_.simulated.drain();
        for (const auto& client : clients_) {
            client->checkInQuietly();
        }
        world_.simulated.drain();
        spreadTheWord();
        for (const auto& client : clients_) {
            client->judgeOutcomes();
        }
        if (delay_ && world_.simulated.preferences.durableValue("deleteDelay") != PropertyList(*delay_)) {
            world_.report(invariants::flushed, "the preferences", "an administrator's change is lost");
        }
    }

    /// Everything there is is reported as new, by the daemon's own hand; every client hears its share.
    void spreadTheWord()
    {
        for (const auto& client : clients_) {
            client->listenClosely();
        }
        const auto report = reportOfAdded(world_.registry.enabled());
        world_.simulated.run(world_.daemon->fontChanged(report, [] {}));
        for (const auto& client : clients_) {
            client->judgeHearing();
        }
    }

    void leave()
    {
        for (const auto& client : clients_) {
            client->disconnect();
        }
        world_.simulated.drain();
        world_.judgeTheEnd();
    }

    /// The steps that have not come yet are not taken any more.
    bool isOver_ = false;
    World world_;
    std::vector<std::unique_ptr<SimulatedClient>> clients_;
    std::optional<std::int64_t> delay_;
};

}  // namespace

Findings simulateDaemon(std::uint64_t seed, Defect defect)
{
    Life first(seed, defect);
    if (seed % 3 != 0) {
        first.live();
        return first.findings();
    }
    first.dieEarly();
    Life second(~seed, defect, first);
    second.live();
    auto findings = second.findings();
    findings.log.insert(0, first.findings().log + "killed, and started again\n");
    return findings;
}

}  // namespace typhon::simulation
