#include "simulation/deletion_simulation.h"

#include "deletion/scheduled_font_deletion.h"
#include "platform/simulated/simulated_platform.h"

#include <chrono>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

// The model is the rules without the machinery: what was scheduled for when, and what the disk holds. It is
// told of every step and looks at the device after every pass: a file may be gone only if it was scheduled
// and came within three minutes of its date while a pass ran; nothing that is due survives a pass; and a
// restart brings a pass. Sentinels outside the trees have to be there in the end.
//
// The disk fails now and then, for a while: then the daemon goes by what it has in memory, and a restart by
// what was flushed last. That is all of one recording, or nothing of it, also when the daemon ends in its
// middle.

namespace typhon::simulation {

namespace {

constexpr std::uint64_t stepsOfARun = 40;
constexpr double tolerance = 180;
constexpr const char* deleteKey = "delete";

const std::vector<std::string>& sentinels()
{
    static const std::vector<std::string> paths{"/etc/passwd",
                                                "/var/mobile/Library/UserFonts/UserFonts.plist",
                                                "/var/mobile/Library/UserFonts/FontFiles.old/a.ttf"};
    return paths;
}

const std::vector<std::string>& hostilePaths()
{
    static const std::vector<std::string> paths{
        "/etc/passwd",
        "/var/mobile/Library/UserFonts/FontFiles/../UserFonts.plist",
        "/var/mobile/Library/UserFonts/FontFiles/../../../../../etc/passwd",
        "/var/mobile/Library/UserFonts/FontAssets/",
        "/var/mobile/Library/UserFonts/FontFiles/a/../b/0.ttf",
    };
    return paths;
}

class Run {
public:
    explicit Run(std::uint64_t seed) : simulated_(seed)
    {
        for (const auto& path : sentinels()) {
            simulated_.fileSystem.addFile(path, PropertyList());
        }
    }

    Findings findings()
    {
        restart();
        for (std::uint64_t step = 0; step < stepsOfARun; ++step) {
            flushesBefore_ = flushes();
            takeStep();
            judge();
            judgeDisk();
        }
        bringEverythingDue();
        for (const auto& path : sentinels()) {
            if (!simulated_.fileSystem.exists(path)) {
                report(path + " is gone");
            }
        }
        return {violations_, simulated_.log.text()};
    }

private:
    std::uint64_t pick(std::uint64_t bound) { return simulated_.scheduler.pick(bound); }
    double now() const { return simulated_.clock.now(); }
    void report(const std::string& violation) { violations_.push_back(violation); }

    std::string somePath()
    {
        static const std::vector<std::string> folders{"/var/mobile/Library/UserFonts/FontFiles/a/",
                                                      "/var/mobile/Library/UserFonts/FontFiles/b/",
                                                      "/var/mobile/Library/UserFonts/FontAssets/c.asset/"};
        return folders[pick(folders.size())] + std::to_string(pick(4)) + ".ttf";
    }

    void takeStep()
    {
        switch (pick(11)) {
        case 0:
            restart();
            break;
        case 1:
            stepClock();
            break;
        case 2:
            simulated_.preferences.changeFromOutside("deleteDelay", someDelay());
            break;
        case 3:
        case 4:
            schedule();
            break;
        case 5:
            addFile();
            break;
        case 6:
            isDiskFailing_ = !isDiskFailing_;
            simulated_.preferences.setFailing(isDiskFailing_);
            break;
        case 7:
            scheduleAndDie();
            break;
        default:
            advance(static_cast<double>(pick(20'000)));
        }
    }

    std::optional<PropertyList> someDelay()
    {
        static const std::vector<double> delays{-1, 0, 0.5, 5, 200, 1000, 20'000, 400'000};
        return pick(6) == 0 ? std::optional<PropertyList>() : PropertyList(delays[pick(delays.size())]);
    }

    void addFile()
    {
        const auto path = somePath();
        simulated_.fileSystem.addFile(path, PropertyList());
        present_.insert(path);
    }

    /// With a hostile one among them.
    std::vector<std::string> somePaths()
    {
        std::vector<std::string> paths;
        for (auto count = pick(4); count != 0; --count) {
            paths.push_back(somePath());
        }
        paths.push_back(hostilePaths()[pick(hostilePaths().size())]);
        return paths;
    }

    void expectScheduled(const std::vector<std::string>& paths)
    {
        const auto chosen = simulated_.preferences.number("deleteDelay");
        const auto delay = chosen > 0 ? static_cast<double>(static_cast<std::uint32_t>(chosen)) : 10'800.0;
        for (const auto& path : paths) {
            if (path.starts_with("/var/mobile/Library/UserFonts/FontFiles/") ||
                path.starts_with("/var/mobile/Library/UserFonts/FontAssets/")) {
                due_[path] = now() + delay;
            }
        }
    }

    void schedule()
    {
        const auto paths = somePaths();
        expectScheduled(paths);
        simulated_.run(deletion_->scheduleFontFilesDeletion(paths));
        if (flushes() == flushesBefore_) {
            report("a recording was not flushed");
        }
    }

    /// The daemon ends before a recording, or between it and what follows from it.
    void scheduleAndDie()
    {
        const auto paths = somePaths();
        const auto queue = simulated_.queues.createSerialQueue("the connection of a client");
        queue->asyncForConnection(nullptr, deletion_->scheduleFontFilesDeletion(paths));
        for (auto steps = 1 + pick(3); steps != 0; --steps) {
            simulated_.scheduler.step();
        }
        if (flushes() != flushesBefore_) {
            expectScheduled(paths);
            expectFlushed();
        }
        restart();
    }

    void stepClock()
    {
        static const std::vector<double> steps{-86'400.0 * 3, -86'400, -3'600,      -10, 10,
                                               3'600,         86'400,  86'400.0 * 3};
        simulated_.scheduler.stepWallClock(steps[pick(steps.size())]);
        // What a pass could have found due before the step.
        judge();
    }

    void advance(double seconds)
    {
        simulated_.scheduler.advance(
            std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::duration<double>(seconds)));
    }

    void restart()
    {
        deletion_.reset();
        simulated_.preferences.restart();
        simulated_.drain();
        due_ = flushed_;
        deletion_ = std::make_shared<ScheduledFontDeletion>(simulated_.platform, [] {});
        const bool hadSomething = !entries().empty();
        const auto before = passes();
        deletion_->setupForScheduledFontDeletion();
        simulated_.drain();
        if ((passes() != before) != hadSomething) {
            report("a start with a schedule did not run a pass, or one without did");
        }
        if (hadSomething) {
            expectNothingDue();
        }
    }

    PropertyList::Dictionary entries() { return simulated_.preferences.dictionary(deleteKey); }
    std::size_t passes() const
    {
        return simulated_.log.count(LogSink::daemon, LogLevel::debug, "executeScheduledFontFilesDeletion");
    }

    std::size_t flushes() const { return simulated_.preferences.synchronizes(); }

    void expectFlushed()
    {
        if (!isDiskFailing_) {
            flushed_ = due_;
        }
    }

    /// After `judge`: every writing puts everything that is in memory on the disk.
    void judgeDisk()
    {
        if (flushes() != flushesBefore_) {
            expectFlushed();
        }
        std::map<std::string, double> stored;
        const auto value = simulated_.preferences.durableValue(deleteKey);
        for (const auto& [path, date] : value ? *value->asDictionary() : PropertyList::Dictionary()) {
            stored.emplace(path, date.asDate()->seconds);
        }
        if (stored != flushed_) {
            report("the schedule on the disk is not the one that was flushed");
        }
    }

    void expectNothingDue()
    {
        for (const auto& [path, date] : entries()) {
            if (date.asDate()->seconds - now() < tolerance) {
                report(path + " is due and still scheduled after a pass");
            }
        }
    }

    /// Looks at every file that is known to have been there.
    void judge()
    {
        const auto scheduled = entries();
        for (auto path = present_.begin(); path != present_.end();) {
            const bool isThere = simulated_.fileSystem.exists(*path);
            const auto due = due_.find(*path);
            if (!isThere && (due == due_.end() || due->second - now() >= tolerance)) {
                report(*path + (due == due_.end() ? " was never scheduled and is gone" : " went too early"));
            }
            if (!isThere && scheduled.contains(*path)) {
                report(*path + " is gone and still scheduled");
            }
            if (isThere && due != due_.end() && !scheduled.contains(*path)) {
                report(*path + " is there, was scheduled and is not any more");
            }
            if (!isThere) {
                due_.erase(*path);
            }
            path = isThere ? std::next(path) : present_.erase(path);
        }
        forgetWhatIsNotScheduled(scheduled);
    }

    /// A path without a file is forgotten by a pass like any other.
    void forgetWhatIsNotScheduled(const PropertyList::Dictionary& scheduled)
    {
        std::erase_if(due_, [&](const auto& entry) { return !scheduled.contains(entry.first); });
        for (const auto& [path, date] : scheduled) {
            const auto due = due_.find(path);
            if (due == due_.end() || due->second != date.asDate()->seconds) {
                report(path + " is scheduled for another time than asked for");
            }
        }
    }

    void bringEverythingDue()
    {
        simulated_.scheduler.stepWallClock(86'400.0 * 30);
        restart();
        judge();
        if (!entries().empty()) {
            report("a month later something is still scheduled");
        }
    }

    SimulatedPlatform simulated_;
    std::shared_ptr<ScheduledFontDeletion> deletion_;
    /// The files of the trees that are there, and when each scheduled path is due.
    std::set<std::string> present_;
    std::map<std::string, double> due_;
    /// What a restarted daemon finds of that.
    std::map<std::string, double> flushed_;
    bool isDiskFailing_ = false;
    std::size_t flushesBefore_ = 0;
    std::vector<std::string> violations_;
};

}  // namespace

Findings simulateDeletion(std::uint64_t seed)
{
    return Run(seed).findings();
}

}  // namespace typhon::simulation
