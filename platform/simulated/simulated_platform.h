#pragma once

#include "platform/platform.h"
#include "platform/simulated/simulated_analytics.h"
#include "platform/simulated/simulated_application_registry.h"
#include "platform/simulated/simulated_asset_service.h"
#include "platform/simulated/simulated_background_activities.h"
#include "platform/simulated/simulated_clock.h"
#include "platform/simulated/simulated_code_signing.h"
#include "platform/simulated/simulated_file_events.h"
#include "platform/simulated/simulated_file_system.h"
#include "platform/simulated/simulated_ipc.h"
#include "platform/simulated/simulated_log.h"
#include "platform/simulated/simulated_notifications.h"
#include "platform/simulated/simulated_preferences.h"
#include "platform/simulated/simulated_process_lifecycle.h"
#include "platform/simulated/simulated_processes.h"
#include "platform/simulated/simulated_remote_alerts.h"
#include "platform/simulated/simulated_sandbox.h"
#include "platform/simulated/simulated_scheduler.h"
#include "platform/simulated/simulated_user_font_manager.h"
#include "platform/simulated/simulated_work_queues.h"

#include <cstdint>
#include <functional>
#include <memory>

namespace typhon {

/// The two ends of a connection between the process under test and another one.
struct SimulatedConnectionPair {
    /// The end of the process under test, accepted but neither configured nor resumed.
    std::shared_ptr<Connection> accepted;
    /// The other process's end, resumed.
    std::shared_ptr<Connection> client;
};

/// A whole simulated device, one of each service, for one thread. Everything that happens on it follows
/// from the seed.
class SimulatedPlatform {
public:
    explicit SimulatedPlatform(std::uint64_t seed = 1) : scheduler(seed) {}
    /// Ends every connection, lets what follows from that happen, and drops work that is still suspended.
    ~SimulatedPlatform();
    SimulatedPlatform(const SimulatedPlatform&) = delete;
    SimulatedPlatform& operator=(const SimulatedPlatform&) = delete;

    /// Runs everything there is to run at the present virtual time.
    void drain() { scheduler.runUntilIdle(); }

    /// The power fails: nothing runs any more, and everybody lets go of what was to run. Not from within
    /// work.
    void losePower();

    /// Runs `work` on a queue of its own, and everything that follows from it. Aborts if the work never ends;
    /// throws what it threw.
    void run(Task<void> work) { runOn(nullptr, std::move(work)); }
    /// The same as if the work handled a message of that process.
    void runAs(const AuditToken& token, Task<void> work);
    void runAs(const AuditToken& token, std::function<void()> work);

    /// Connects a process to the one under test. `clientCalls`: what the other process may call.
    SimulatedConnectionPair connect(const AuditToken& token, InterfaceDescriptions clientCalls = nullptr);

    // In the order in which they build on each other.
    SimulatedScheduler scheduler;
    SimulatedWorkQueues queues{scheduler};
    SimulatedClock clock{scheduler};
    SimulatedLog log;
    SimulatedProcesses processes;
    SimulatedCodeSigning codeSigning{processes};
    SimulatedSandbox sandbox{processes};
    SimulatedPreferences preferences;
    SimulatedFileSystem fileSystem;
    SimulatedApplicationRegistry applicationRegistry;
    SimulatedUserFontManager userFontManager{scheduler, fileSystem};
    SimulatedProcessLifecycle processLifecycle{processes};
    SimulatedAnalytics analytics{scheduler};
    SimulatedNotifications notifications;
    SimulatedAssetService assetService{scheduler};
    SimulatedFileEvents fileEvents{scheduler};
    SimulatedBackgroundActivities backgroundActivities{scheduler};

private:
    std::unique_ptr<SimulatedIpc> ownedIpc_ = std::make_unique<SimulatedIpc>(queues, log);

public:
    SimulatedIpc& ipc = *ownedIpc_;
    SimulatedRemoteAlerts remoteAlerts{ipc};
    Platform platform{queues,
                      clock,
                      ipc,
                      codeSigning,
                      sandbox,
                      preferences,
                      fileSystem,
                      log,
                      applicationRegistry,
                      userFontManager,
                      processLifecycle,
                      remoteAlerts,
                      analytics,
                      notifications,
                      assetService,
                      fileEvents,
                      backgroundActivities};

private:
    void runOn(std::shared_ptr<void> connection, Task<void> work);
};

}  // namespace typhon
