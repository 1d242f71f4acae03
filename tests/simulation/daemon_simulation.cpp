#include "simulation/daemon_simulation.h"

#include "simulation/simulated_clients.h"
#include "simulation/world.h"

#include <chrono>

// A run is a number of steps, each of which lets one client act or changes the device, posted so that the
// scheduler mixes them with everything that the daemon does meanwhile. Every answer is judged as it arrives,
// against the most its client may have been told; then the device is left in peace, and every client that is
// still there checks in once more and must see exactly what is there.

namespace typhon::simulation {

namespace {

constexpr std::uint64_t stepsOfARun = 120;

class Run {
public:
    explicit Run(std::uint64_t seed) : world_(seed) {}

    Findings findings()
    {
        startUp(*world_.daemon);
        for (std::uint64_t step = 0; step < stepsOfARun; ++step) {
            const std::chrono::milliseconds time(pick(30'000));
            world_.simulated.scheduler.schedule(time, [this] { takeStep(); });
        }
        // Font requests pause, one after another, and who waits for a process waits for long.
        world_.simulated.scheduler.advance(std::chrono::minutes(10));
        settle();
        leave();
        return {world_.violations, world_.simulated.log.text()};
    }

private:
    std::uint64_t pick(std::uint64_t bound) { return world_.simulated.scheduler.pick(bound); }

    void takeStep()
    {
        const auto what = pick(20);
        if (what == 0) {
            changeRegistry();
        } else if (what < 3) {
            issueSomething();
        } else if (what == 3) {
            world_.simulated.preferences.setFailing(pick(2) == 0);
        } else if (what < 7 || clients_.empty()) {
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

    void settle()
    {
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
        expectNone("connections", world_.simulated.ipc.connectionCount());
        expectNone("failed reply handlers", world_.simulated.log.countContaining("reply handler failed"));
        expectNone("observers", world_.daemon->notificationCenter().observerCount("fontChanged"));
        expectNone("failed handlers", world_.simulated.log.countContaining("handler of "));
        expectNone("replies that do not fit", world_.simulated.log.countContaining("does not fit"));
    }

    void expectNone(const std::string& what, std::size_t count)
    {
        if (count != 0) {
            world_.report("the daemon", std::to_string(count) + " " + what + " at the end");
        }
    }

    World world_;
    std::vector<std::unique_ptr<SimulatedClient>> clients_;
};

}  // namespace

Findings simulateDaemon(std::uint64_t seed)
{
    return Run(seed).findings();
}

}  // namespace typhon::simulation
