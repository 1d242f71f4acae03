#include "fontmanager/daemon/change_reports.h"
#include "fontmanager/daemon/daemon_identities.h"
#include "fontmanager/daemon/font_registry_service.h"
#include "fontmanager/daemon/helper_life.h"
#include "fontmanager/daemon/peer_process.h"
#include "fontmanager/font_parser.h"
#include "fontmanager/font_store.h"
#include "fontmanager/profile_fonts.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/linux_ipc.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/process_limits.h"
#include "platform/linux/program_options.h"
#include "platform/linux/service_user.h"

#include <array>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <memory>
#include <string>

#include <systemd/sd-daemon.h>
#include <unistd.h>

// The helper of the font-registry library: the one process that writes the registry of fonts and the
// directories of font files. It opens the store first, which completes what an earlier run left unfinished,
// and only then its socket. It may be killed at any time; ending in order saves nothing but the sweeping.

namespace typhon {

namespace {

struct Options : ProgramOptions {
    long idleSeconds = 60;
};

/// The services of the helper, each after those it stands on.
struct Helper {
    explicit Helper(const Options& options)
        : root(options.root), log(options.logLevel),
          ipc(pool, queues, log, root, instanceOfPeer, IpcLimits{}, EndpointHandshake::client)
    {}

    RootDirectory root;
    LinuxLog log;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    std::shared_ptr<WorkQueue> changes = queues.createSerialQueue("com.vorlan.typhond.fontChanges");
    LinuxIpc ipc;
    DaemonIdentities identities{ipc};
    DaemonReports reports{ipc, log};
    FontParser parser;
    ReadFontNames readNames = [this](int descriptor) { return parser.read(descriptor); };
    FontStore store{root, readNames, log};
    ProfileFonts profileFonts{root, readNames, log};
    FontAssets fontAssets{root, readNames, log};
};

Options parsed(int argc, char** argv)
{
    Options options;
    CLI::App app{"Installs and removes fonts for the programs that may not write to the font directories."};
    app.name("typhon-fontmanagerd");
    addProgramOptions(app, options);
    app.add_option(
           "--idle", options.idleSeconds,
           "End after this long without a connection, where the service manager or no font daemon runs")
        ->type_name("SECONDS")
        ->check(CLI::Range(1L, 86400L));
    parseProgramOptions(app, argc, argv, options);
    return options;
}

/// Waits for a signal to end, or until `life` says so.
void waitForTheEnd(HelperLife& life, const FontRegistryService& service, Log& log)
{
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    while (true) {
        const timespec pause{.tv_sec = 1, .tv_nsec = 0};
        if (::sigtimedwait(&signals, nullptr, &pause) > 0) {
            return;
        }
        if (const auto reason =
                life.reasonToEnd(service.connectionCount(), std::chrono::steady_clock::now())) {
            TYLog(log, "ending: " + *reason);
            return;
        }
    }
}

/// Makes up for what an earlier run, which may have been killed, did not report any more.
Task<void> reportCompleted(Helper& helper, RegistryChange change)
{
    Task<void> reporting = helper.reports.report(std::move(change), ChangeReports::Kind::userFonts);
    co_await std::move(reporting);
    helper.store.changeWasReported();
}

int run(const Options& options)
{
    static Helper helper(options);
    if (helper.root.isScratch() && !std::filesystem::is_directory(helper.root.directory())) {
        TYLog_Error(helper.log, "there is no folder " + helper.root.directory());
        return 1;
    }
    auto opening = helper.store.open();
    if (opening.error) {
        TYLog_Error(helper.log, *opening.error);
        return 1;
    }
    const auto service = std::make_shared<FontRegistryService>(
        FontRegistryService::Parts{.store = helper.store,
                                   .profileFonts = helper.profileFonts,
                                   .fontAssets = helper.fontAssets,
                                   .identities = helper.identities,
                                   .reports = helper.reports,
                                   .log = helper.log,
                                   .changes = *helper.changes},
        OwnUser{.user = ::geteuid(), .isServiceUser = !helper.root.isScratch() && runsAsServiceUser()});
    const bool isSocketActivated = sd_listen_fds(0) > 0;
    if (!isSocketActivated && !HelperLife::awaitName(helper.root)) {
        TYLog_Error(helper.log, "another helper serves this system");
        return 1;
    }
    if (const auto error = isSocketActivated ? std::nullopt : HelperLife::announce(helper.root)) {
        TYLog_Error(helper.log, *error);
    }
    helper.changes->async(reportCompleted(helper, std::move(opening.change)));
    const auto listener = startFontRegistryService(helper.ipc, service);
    HelperLife life(helper.root, {.idle = std::chrono::seconds(options.idleSeconds),
                                  .isSocketActivated = isSocketActivated});
    waitForTheEnd(life, *service, helper.log);
    listener->invalidate();
    if (!isSocketActivated) {
        HelperLife::withdraw(helper.root);
    }
    // Whatever is under way in other threads may end in its middle: it is all or none.
    ::_exit(0);
}

void blockSignals()
{
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    // Inherited by all threads, so that only the one that waits for them gets them.
    ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

}  // namespace

}  // namespace typhon

int main(int argc, char** argv)
{
    const auto options = typhon::parsed(argc, argv);
    typhon::prepareProcess();
    typhon::blockSignals();
    return typhon::run(options);
}
