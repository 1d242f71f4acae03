#pragma once

#include "daemon/typhon_daemon.h"
#include "platform/simulated/simulated_platform.h"
#include "simulation/defects.h"
#include "simulation/invariants.h"
#include "simulation/simulated_registry.h"
#include "simulation/watched_services.h"

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon::simulation {

/// What the daemon of a world stands on: the simulated services, under watch, and broken where the defect
/// wants it. A watch is next to the daemon where the service is what may break, and else next to the service.
struct DaemonServices {
    DaemonServices(SimulatedPlatform& simulated, Defect defect,
                   WatchedPreferences::Report reportUnregistered);

    MeddlingQueues queues;
    ConfusableCodeSigning codeSigning;
    WatchedFileSystem watchedFileSystem;
    AgeingFileSystem fileSystem;
    PretendingPreferences realPreferences;
    WatchedPreferences preferences;
    MeddlingIpc ipc;
    Platform platform;
};

/// A simulated device with its daemon, and what must be remembered of its past to judge the daemon by.
struct World {
    explicit World(std::uint64_t seed, Defect defect = Defect::none);
    /// The same device after a restart: new processes, and what was on the disk. Judges what is no longer
    /// there.
    World(std::uint64_t seed, Defect defect, World& before);
    ~World() { services->ipc.release(); }
    World(const World&) = delete;
    World& operator=(const World&) = delete;

    void report(const Invariant& invariant, const std::string& who, const std::string& violation)
    {
        violations.push_back(std::string(invariant.name) + ": " + who + ": " + violation);
    }
    /// Reports that there is something left of that which should be gone.
    void expectNone(const Invariant& invariant, const std::string& what, std::size_t count);
    /// An administrator's change of a preference.
    void changePreference(const std::string& key, PropertyList value);
    /// Every client is gone, and nothing is going on: judges what is left, and lets go of the daemon.
    void judgeTheEnd();

    /// The paths that were ever to be recorded for an application.
    std::map<std::string, std::set<std::string>> everIssued;
    std::vector<std::string> violations;
    // Made last, and there until the simulated platform has come to its end.
    std::unique_ptr<DaemonServices> services;
    SimulatedPlatform simulated;
    SimulatedRegistry registry{simulated};
    std::shared_ptr<TyphonDaemon> daemon;

private:
    void judgeRestart(World& before);
};

}  // namespace typhon::simulation
