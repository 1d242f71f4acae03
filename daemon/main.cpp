#include "daemon/start_up.h"
#include "daemon/typhon_daemon.h"
#include "fontmanager/linux_user_font_manager.h"
#include "platform/linux/audit_tokens.h"
#include "platform/linux/confinement.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/extension_tokens.h"
#include "platform/linux/file_access_broker.h"
#include "platform/linux/identities_service.h"
#include "platform/linux/linux_analytics.h"
#include "platform/linux/linux_application_registry.h"
#include "platform/linux/linux_asset_service.h"
#include "platform/linux/linux_background_activities.h"
#include "platform/linux/linux_clock.h"
#include "platform/linux/linux_code_signing.h"
#include "platform/linux/linux_file_events.h"
#include "platform/linux/linux_file_system.h"
#include "platform/linux/linux_ipc.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/linux_notifications.h"
#include "platform/linux/linux_preferences.h"
#include "platform/linux/linux_process_lifecycle.h"
#include "platform/linux/linux_remote_alerts.h"
#include "platform/linux/linux_sandbox.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/process_inspection.h"
#include "platform/linux/process_limits.h"
#include "platform/linux/program_options.h"
#include "platform/linux/sandbox_instances.h"
#include "platform/linux/sandboxes_service.h"
#include "platform/linux/session_agent_service.h"
#include "platform/linux/session_agents.h"
#include "platform/linux/signature_store.h"

#include <random>
#include <string>

#include <unistd.h>

// The composition root: the one place that knows the services of Linux. It builds them, hands them to the
// daemon as a `Platform`, opens the services beside the daemon's own, and gives the main thread away.
// Nothing here is ever torn down: the process runs until the system stops it.

namespace typhon {

namespace {

struct Options : ProgramOptions {
    bool isInternalBuild = false;
};

/// A number in [0, 1).
double randomFraction()
{
    std::random_device device;
    return std::uniform_real_distribution<double>()(device);
}

/// The services of Linux, each after those it stands on.
struct LinuxServices {
    explicit LinuxServices(const Options& options)
        : root(options.root), log(options.logLevel),
          ipc(pool, queues, log, root, tokenOfPeer, limitsOfDaemon())
    {}

    RootDirectory root;
    LinuxLog log;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    LinuxClock clock;
    LinuxPreferences preferences{root, log};
    SlowReads slowReads{queues, log};
    LinuxFileSystem fileSystem{root, &slowReads};
    LinuxApplicationRegistry applicationRegistry{root, log};
    LinuxUserFontManager userFontManager{root, log};
    LinuxAnalytics analytics{root, log, queues};
    LinuxNotifications notifications{pool, queues, log, root};
    LinuxAssetService assetService{
        pool,
        log,
        root,
        {.post = [this](const std::string& name) { notifications.postNotifyCentreNotification(name); },
         .downloader = {}}};
    LinuxFileEvents fileEvents{pool, queues, log, root};
    LinuxBackgroundActivities backgroundActivities{
        {.queues = queues, .clock = clock, .log = log, .random = randomFraction}, root};

    ConfinementProbe probe;
    SignatureStore signatures{root, log};
    SandboxInstances sandboxInstances{probe, signatures, pool};
    LinuxCodeSigning codeSigning{probe, sandboxInstances, signatures};
    ExtensionTokens tokens;
    LinuxSandbox sandbox{probe, tokens, root};
    SessionAgents sessionAgents{codeSigning, sandbox, log, ::geteuid()};
    LinuxProcessLifecycle processLifecycle{sessionAgents, probe};
    LinuxRemoteAlerts remoteAlerts{sessionAgents};
    LinuxIpc ipc;
};

Options parsed(int argc, char** argv)
{
    Options options;
    CLI::App app{
        "Per-application font access: decides which user-installed fonts a program may see and read."};
    app.name("typhond");
    addProgramOptions(app, options);
    app.add_flag("--internal-build", options.isInternalBuild,
                 "Behave as on an internal build of the system, where scheduled deletions come sooner");
    parseProgramOptions(app, argc, argv, options);
    return options;
}

void run(const Options& options)
{
    static LinuxServices services(options);
    static Platform platform{.queues = services.queues,
                             .clock = services.clock,
                             .ipc = services.ipc,
                             .codeSigning = services.codeSigning,
                             .sandbox = services.sandbox,
                             .preferences = services.preferences,
                             .fileSystem = services.fileSystem,
                             .log = services.log,
                             .applicationRegistry = services.applicationRegistry,
                             .userFontManager = services.userFontManager,
                             .processLifecycle = services.processLifecycle,
                             .remoteAlerts = services.remoteAlerts,
                             .analytics = services.analytics,
                             .notifications = services.notifications,
                             .assetService = services.assetService,
                             .fileEvents = services.fileEvents,
                             .backgroundActivities = services.backgroundActivities,
                             .isInternalBuild = options.isInternalBuild};

    logProcessIdentity(services.log);
    logMissingMemoryFiles(services.log);
    const auto broker = std::make_shared<FileAccessBroker>(services.codeSigning, services.tokens,
                                                           services.root, services.log);
    const auto sandboxes = std::make_shared<SandboxesService>(services.sandboxInstances, services.log);
    const auto identities =
        std::make_shared<IdentitiesService>(services.codeSigning, services.sandbox, services.log);
    const auto brokerListener = startFileAccessService(services.ipc, broker);
    const auto sandboxesListener = startSandboxesService(services.ipc, sandboxes);
    const auto identitiesListener = startIdentitiesService(services.ipc, identities);
    const auto agents = std::make_shared<SessionAgentService>(services.sessionAgents);
    const auto agentsListener = startSessionAgentService(services.ipc, agents);

    services.notifications.start();

    const auto daemon = TyphonDaemon::sharedDaemon(platform);
    startUp(*daemon);
    daemon->run();
}

}  // namespace

}  // namespace typhon

int main(int argc, char** argv)
{
    const auto options = typhon::parsed(argc, argv);
    typhon::prepareProcess();
    typhon::run(options);
}
