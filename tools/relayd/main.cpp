#include "platform/linux/event_pool.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/program_options.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/system_bus.h"
#include "tools/relayd/application_watch.h"
#include "tools/relayd/notification_relay.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

// Nothing here is ever torn down: the process runs until the system stops it. Without a bus it waits for one.

namespace typhon {

namespace {

struct Options : ProgramOptions {
    double removalWindow = 10;
};

Options parsed(int argc, char** argv)
{
    Options options;
    CLI::App app{"Announces the system's notifications on the system bus, and the removal of applications."};
    app.name("typhon-relayd");
    addProgramOptions(app, options);
    app.add_option("--removal-window", options.removalWindow,
                   "Seconds for which an application's desktop entry may be missing, as in an upgrade")
        ->type_name("SECONDS")
        ->check(CLI::Range(0.0, 3600.0))
        ->capture_default_str();
    parseProgramOptions(app, argc, argv, options);
    return options;
}

constexpr const char* applicationUnregistered = "com.vorlan.Startwell.applicationUnregistered";
/// Identifiers in one announcement.
constexpr std::size_t mostAtOnce = 1000;

void announceRemoved(NotificationRelay& relay, const std::vector<std::string>& identifiers)
{
    for (std::size_t first = 0; first < identifiers.size(); first += mostAtOnce) {
        const auto begin = identifiers.begin() + static_cast<std::ptrdiff_t>(first);
        const auto count = std::min(mostAtOnce, identifiers.size() - first);
        relay.announceDistributed(
            applicationUnregistered,
            {{"bundleIDs", arrayOfStrings({begin, begin + static_cast<std::ptrdiff_t>(count)})}});
    }
}

void run(const Options& options)
{
    static const RootDirectory root(options.root);
    static LinuxLog log(options.logLevel);
    static EventPool pool(EventPool::Options{.minimumThreads = 1, .maximumThreads = 4});
    static LinuxWorkQueues queues(pool);
    static const auto relay = std::make_shared<NotificationRelay>(isRootOrOwnUser, log);
    static const auto bus = std::make_shared<SystemBus>(pool, queues, log, root.real(systemBusSocket));
    static const auto applications = std::make_shared<ApplicationWatch>(
        ApplicationWatch::Services{pool, queues, log}, bus->queue(), root,
        std::chrono::nanoseconds(static_cast<std::int64_t>(options.removalWindow * 1e9)),
        [](const std::vector<std::string>& identifiers) { announceRemoved(*relay, identifiers); });
    bus->start(relay);
    applications->start();
    queues.runMainLoop();
}

}  // namespace

}  // namespace typhon

int main(int argc, char** argv)
{
    const auto options = typhon::parsed(argc, argv);
    std::signal(SIGPIPE, SIG_IGN);
    typhon::run(options);
}
