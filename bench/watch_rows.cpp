// What it costs to watch the asset store while nothing happens in it.

#include "rows.h"
#include "scratch_daemon.h"

#include <ctime>
#include <filesystem>
#include <fstream>
#include <string>

#include <unistd.h>

namespace typhon::bench {

namespace {

constexpr int directories = 20'000;
constexpr int directoriesOfOne = 100;
constexpr unsigned settlingSeconds = 20;
constexpr unsigned seconds = 60;
const std::string store = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";

/// Directories that the process watches.
int watchedBy(pid_t process)
{
    int watched = 0;
    const auto folder = "/proc/" + std::to_string(process) + "/fdinfo";
    for (const auto& descriptor : std::filesystem::directory_iterator(folder)) {
        std::ifstream file(descriptor.path());
        for (std::string line; std::getline(file, line);) {
            watched += line.starts_with("inotify ") ? 1 : 0;
        }
    }
    return watched;
}

double processorSecondsOf(pid_t process)
{
    clockid_t clock{};
    timespec time{};
    ::clock_getcpuclockid(process, &clock);
    ::clock_gettime(clock, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

void awaitWatch(const ScratchDaemon& daemon, int number)
{
    while (watchedBy(daemon.pid()) < number) {
        ::usleep(100'000);
    }
}

}  // namespace

void measureWatch(Report& report)
{
    Report::begin("Watching for a minute");
    ScratchDaemon many(0, {});
    ScratchDaemon none(0, {});
    std::filesystem::create_directories(none.folder().real(store));
    for (int index = 0; index < directories - 1; ++index) {
        // Where the library does not look for fonts.
        const auto path = store + "bench.asset/" + std::to_string(index / directoriesOfOne) + "/" +
                          std::to_string(index % directoriesOfOne);
        std::filesystem::create_directories(many.folder().real(path));
    }
    many.start();
    none.start();
    awaitWatch(many, directories);
    awaitWatch(none, 1);
    // Memory that the start took is given back some seconds later.
    ::sleep(settlingSeconds);
    const double manyBefore = processorSecondsOf(many.pid());
    const double noneBefore = processorSecondsOf(none.pid());
    ::sleep(seconds);
    report.addFigure("Processor time of the daemon in a minute in which nothing happens, while it watches "
                     "20,000 directories",
                     summaryOf({processorSecondsOf(many.pid()) - manyBefore}));
    report.addFigure("The same with nothing in the store",
                     summaryOf({processorSecondsOf(none.pid()) - noneBefore}));
}

}  // namespace typhon::bench
