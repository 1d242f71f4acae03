#include "simulation/world.h"

#include <array>
#include <utility>

namespace typhon::simulation {

namespace {

constexpr std::array identifiers{"com.example.reader",   "com.example.suite", "com.example.all",
                                 "com.example.provider", "com.example.other", "com.example.plain",
                                 "com.example.string",   "com.example.tool"};

}  // namespace

DaemonServices::DaemonServices(SimulatedPlatform& simulated, Defect defect,
                               WatchedPreferences::Report reportUnregistered)
    : queues(simulated.queues, defect),
      codeSigning(simulated.codeSigning, defect == Defect::confusesProcesses),
      watchedFileSystem(simulated.fileSystem),
      fileSystem(watchedFileSystem, defect == Defect::trustsAnOldRegistry),
      realPreferences(simulated.preferences, defect == Defect::pretendsToFlush),
      preferences(realPreferences, watchedFileSystem, std::move(reportUnregistered)),
      ipc(simulated.ipc, defect), platform{queues,
                                           simulated.clock,
                                           ipc,
                                           codeSigning,
                                           simulated.sandbox,
                                           preferences,
                                           fileSystem,
                                           simulated.log,
                                           simulated.applicationRegistry,
                                           simulated.userFontManager,
                                           simulated.processLifecycle,
                                           simulated.remoteAlerts,
                                           simulated.analytics,
                                           simulated.notifications,
                                           simulated.assetService,
                                           simulated.fileEvents,
                                           simulated.backgroundActivities}
{}

World::World(std::uint64_t seed, Defect defect) : simulated(seed)
{
    using Array = PropertyList::Array;
    using Dictionary = PropertyList::Dictionary;
    simulated.applicationRegistry.install({"com.example.barred", "1.0", false});
    simulated.applicationRegistry.install({"com.example.editor", "1.0", false});
    for (const auto* identifier : identifiers) {
        simulated.applicationRegistry.install({identifier, "1.0", false});
    }
    services = std::make_unique<DaemonServices>(simulated, defect, [this](const std::string& violation) {
        report(invariants::registered, "the ledger", violation);
    });
    daemon = std::make_shared<TyphonDaemon>(services->platform);
    daemon->clientCapabilities().setFontEnumerationProhibitedInfo(
        Array{Dictionary{{"com.example.barred", Array{"0.9", "1.0"}}},
              Dictionary{{"com.example.editor", Array{"1.1"}}}});
}

World::World(std::uint64_t seed, Defect defect, World& before) : World(seed, defect)
{
    everIssued = before.everIssued;
    violations = before.violations;
    registry.continueFrom(before.registry);
    for (const auto& [key, value] : before.simulated.preferences.durable()) {
        changePreference(key, value);
    }
    judgeRestart(before);
}

void World::judgeRestart(World& before)
{
    for (const auto& [key, value] : before.services->preferences.flushed()) {
        if (simulated.preferences.value(key) != value) {
            report(invariants::flushed, "the preferences", key + " is not what was flushed");
        }
    }
    if (before.simulated.preferences.hasUnsynchronizedChanges()) {
        return;
    }
    for (const auto* identifier : identifiers) {
        if (daemon->issuedPathsLedger().issuedFontFilePathsForIdentifier(identifier) !=
            before.daemon->issuedPathsLedger().issuedFontFilePathsForIdentifier(identifier)) {
            report(invariants::flushed, "the ledger", std::string(identifier) + " has another record now");
        }
    }
}

void World::changePreference(const std::string& key, PropertyList value)
{
    services->preferences.noteChangeFromOutside(key, value);
    simulated.preferences.changeFromOutside(key, std::move(value));
}

void World::expectNone(const Invariant& invariant, const std::string& what, std::size_t count)
{
    if (count != 0) {
        report(invariant, "the daemon", std::to_string(count) + " " + what + " at the end");
    }
}

void World::judgeTheEnd()
{
    expectNone(invariants::oneAnswer, "repeated answers", simulated.ipc.repeatedAnswers());
    expectNone(invariants::oneAnswer, "failed handlers", simulated.log.countContaining("handler of "));
    expectNone(invariants::oneAnswer, "failed reply handlers",
               simulated.log.countContaining("reply handler failed"));
    expectNone(invariants::oneAnswer, "replies that do not fit",
               simulated.log.countContaining("does not fit"));
    expectNone(invariants::flushed, "preferences that were never flushed",
               services->preferences.neverFlushed().size());
    expectNone(invariants::nothingLeaks, "connections", simulated.ipc.connectionCount());
    expectNone(invariants::nothingLeaks, "observers",
               daemon->notificationCenter().observerCount("fontChanged"));
    expectNone(invariants::nothingLeaks, "unfinished items", simulated.queues.itemCount());
    expectNone(invariants::nothingLeaks, "connections and handlers that somebody holds",
               services->ipc.held());
    const std::weak_ptr<TyphonDaemon> gone = daemon;
    daemon.reset();
    simulated.drain();
    expectNone(invariants::nothingLeaks, "daemons that were let go of", gone.expired() ? 0 : 1);
}

}  // namespace typhon::simulation
