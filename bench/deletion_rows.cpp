// The schedule of font files to be deleted, when it is long.

#include "deletion/scheduled_font_deletion.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/linux_file_system.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/linux_preferences.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_platform.h"
#include "rows.h"

#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <fcntl.h>
#include <unistd.h>

namespace typhon::bench {

namespace {

constexpr int longSchedule = 100'000;
constexpr int dueFiles = 10'000;
constexpr int folders = 500;
constexpr const char* tree = "/var/mobile/Library/UserFonts/FontFiles";

std::string folderOf(int index)
{
    return std::string(tree) + "/com.example.provider" + std::to_string(index);
}

/// Files of one folder after another, as a schedule holds them.
std::string scheduledPath(int index, int files)
{
    return folderOf(index / (files / folders)) + "/font-" + std::to_string(index) + ".ttf";
}

PropertyList::Dictionary schedule(int files, double due)
{
    PropertyList::Dictionary entries;
    for (int index = 0; index < files; ++index) {
        entries.emplace(scheduledPath(index, files), Date{due});
    }
    return entries;
}

/// Time and queues are simulated, so that a pass runs when it is told to; preferences and files are real.
class Device {
public:
    Device()
    {
        std::filesystem::create_directories(folder_.real("/var/mobile/Library/Preferences"));
        std::filesystem::create_directories(folder_.real("/var/mobile/Library/UserFonts/FontAssets"));
    }

    double now() { return simulated_.clock.now(); }
    const ScratchDirectory& folder() const { return folder_; }

    void store(PropertyList::Dictionary entries)
    {
        auto preferences = freshPreferences();
        preferences->setValue("delete", std::move(entries));
        preferences->synchronize();
    }
    std::size_t stored() { return freshPreferences()->dictionary("delete").size(); }
    /// Ones that have read nothing yet.
    std::unique_ptr<LinuxPreferences> freshPreferences()
    {
        return std::make_unique<LinuxPreferences>(root_, log_);
    }

    /// Seconds that a daemon's first pass takes after its start.
    double pass()
    {
        const auto preferences = freshPreferences();
        auto platform = platformWith(*preferences);
        const auto deletion = std::make_shared<ScheduledFontDeletion>(platform, [] {});
        const auto begin = secondsNow();
        deletion->setFontFilesDeletionTimer(0);
        // The timer's leeway.
        simulated_.scheduler.advance(std::chrono::seconds(60));
        return secondsNow() - begin;
    }

    /// A daemon that goes on living.
    class Recorder {
    public:
        explicit Recorder(Device& device)
            : device_(device), preferences_(device.freshPreferences()),
              platform_(device.platformWith(*preferences_)),
              deletion_(std::make_shared<ScheduledFontDeletion>(platform_, [] {}))
        {}
        /// Seconds.
        double record(std::vector<std::string> paths)
        {
            const auto begin = secondsNow();
            device_.simulated_.run(deletion_->scheduleFontFilesDeletion(std::move(paths)));
            device_.simulated_.drain();
            return secondsNow() - begin;
        }

    private:
        Device& device_;
        std::unique_ptr<LinuxPreferences> preferences_;
        Platform platform_;
        std::shared_ptr<ScheduledFontDeletion> deletion_;
    };

private:
    Platform platformWith(LinuxPreferences& preferences)
    {
        const auto& other = simulated_.platform;
        return {other.queues,
                other.clock,
                other.ipc,
                other.codeSigning,
                other.sandbox,
                preferences,
                files_,
                log_,
                other.applicationRegistry,
                other.userFontManager,
                other.processLifecycle,
                other.remoteAlerts,
                other.analytics,
                other.notifications,
                other.assetService,
                other.fileEvents,
                other.backgroundActivities};
    }

    ScratchDirectory folder_;
    RootDirectory root_{folder_.path()};
    LinuxLog log_{LogLevel::error};
    LinuxFileSystem files_{root_};
    SimulatedPlatform simulated_;
};

void expect(bool holds, const char* what)
{
    if (!holds) {
        throw std::runtime_error(what);
    }
}

void measureIdlePass(Report& report)
{
    Device device;
    device.store(schedule(longSchedule, device.now() + 1e9));
    const Step pass = [&] { return device.pass(); };
    const Step reading = timed([&] {
        auto preferences = device.freshPreferences();
        auto value = preferences->value("delete");
        return std::pair(std::move(preferences), std::move(value));
    });
    report.add({"a pass over 100,000 entries, none due", "reading that preference once",
                compare(pass, reading, {.rounds = 12, .steps = 1, .warmUp = 1}), 1.5});
    expect(device.stored() == longSchedule, "an entry that was not due is gone");
}

/// The files to be deleted, in their folders.
void makeFiles(const ScratchDirectory& folder)
{
    for (int index = 0; index < folders; ++index) {
        std::filesystem::create_directories(folder.real(folderOf(index)));
    }
    for (int index = 0; index < dueFiles; ++index) {
        std::ofstream(folder.real(scheduledPath(index, dueFiles))) << "font";
    }
    // So that no flush of the schedule has this to do.
    const FileDescriptor top(::open(folder.real(tree).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    ::fsync(top.get());
}

double secondsOfPass(Device& device)
{
    makeFiles(device.folder());
    device.store(schedule(dueFiles, device.now()));
    const auto seconds = device.pass();
    expect(device.stored() == 0 && std::filesystem::is_empty(device.folder().real(tree)),
           "a file that was due is still there");
    return seconds;
}

/// The files and the folders that they leave empty, relative to the tree.
double secondsOfUnlinking(Device& device)
{
    const auto& folder = device.folder();
    makeFiles(folder);
    // Leaves the disk in the same state as for the other.
    device.store(schedule(dueFiles, device.now()));
    std::vector<std::string> files;
    std::vector<std::string> parents;
    files.reserve(dueFiles);
    parents.reserve(folders);
    const auto below = [](const std::string& path) { return path.substr(std::string(tree).size() + 1); };
    for (int index = 0; index < dueFiles; ++index) {
        files.push_back(below(scheduledPath(index, dueFiles)));
    }
    for (int index = 0; index < folders; ++index) {
        parents.push_back(below(folderOf(index)));
    }
    const FileDescriptor top(::open(folder.real(tree).c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    bool isGone = true;
    const auto begin = secondsNow();
    for (const auto& file : files) {
        isGone = ::unlinkat(top.get(), file.c_str(), 0) == 0 && isGone;
    }
    for (const auto& parent : parents) {
        isGone = ::unlinkat(top.get(), parent.c_str(), AT_REMOVEDIR) == 0 && isGone;
    }
    const auto seconds = secondsNow() - begin;
    expect(isGone, "a file cannot be unlinked");
    return seconds;
}

void measureDeletingPass(Report& report)
{
    Device device;
    Device peer;
    report.add({"deleting 10,000 due files in 500 folders, with the schedule's reading and writing",
                "bare `unlinkat` of as many",
                compare([&] { return secondsOfPass(device); }, [&] { return secondsOfUnlinking(peer); },
                        {.rounds = 5, .steps = 1, .warmUp = 0}),
                1.5});
}

void measureRecording(Report& report)
{
    Device device;
    auto entries = schedule(longSchedule, device.now() + 1e9);
    device.store(entries);
    Device::Recorder recorder(device);
    // Scheduled already, but for another date: so the schedule keeps its length.
    int next = 0;
    const Step ours = [&] {
        std::vector<std::string> paths;
        paths.reserve(1'000);
        for (int count = 0; count < 1'000; ++count) {
            paths.push_back(scheduledPath(next++ * 97 % longSchedule, longSchedule));
        }
        return recorder.record(std::move(paths));
    };
    const auto path = device.folder().real("/peer.plist");
    const PropertyList whole = PropertyList::Dictionary{{"delete", std::move(entries)}};
    const Step peer =
        timed([&] { return replaceFile(path, writeBinaryPropertyList(whole), 0600).has_value(); });
    report.add({"recording 1,000 paths into a schedule of 100,000",
                "encoding that schedule and replacing the file durably",
                compare(ours, peer, {.rounds = 12, .steps = 1, .warmUp = 1}), 1.2});
    expect(device.stored() == longSchedule, "the schedule has another length");
}

}  // namespace

void measureDeletion(Report& report)
{
    Report::begin("A long deletion schedule");
    measureIdlePass(report);
    measureRecording(report);
    Report::begin("Deleting files that are due");
    measureDeletingPass(report);
}

}  // namespace typhon::bench
