#include "deletion/scheduled_font_deletion.h"

#include "deletion/font_file_removal.h"

#include <chrono>
#include <limits>
#include <utility>

// Everything that touches the schedule, the timer or the files runs on one serial queue. Arming and stopping
// are always posted to it, so that what a pass asks for takes effect when it has returned.
//
// The timer is held until the schedule is empty, fired or not, and while it is held only an arming without
// delay counts. What still waits when a pass ends therefore waits for the next start of the daemon, or for a
// later pass. That is intended.
//
// Any client may schedule anything in the trees. Recordings that wait for their turn are few: who comes with
// more waits, and holds nobody's queue but that of its own connection.

namespace typhon {

namespace {

constexpr std::uint32_t defaultDelay = 10'800;
constexpr std::uint32_t defaultDelayOfInternalBuild = 600;
constexpr std::chrono::seconds leewayOfImmediateFiring{60};
constexpr unsigned mostWaitingRecordings = 32;

std::uint32_t wholeSeconds(double seconds)
{
    constexpr auto most = std::numeric_limits<std::uint32_t>::max();
    return seconds >= static_cast<double>(most) ? most : static_cast<std::uint32_t>(seconds);
}

}  // namespace

ScheduledFontDeletion::ScheduledFontDeletion(Platform& platform, std::function<void()> strayEntrySweep)
    : platform_(platform), strayEntrySweep_(std::move(strayEntrySweep)),
      recordings_(platform.queues.createSemaphore(mostWaitingRecordings)), schedule_(platform.preferences)
{}

void ScheduledFontDeletion::setupForScheduledFontDeletion()
{
    if (!schedule_.isEmpty()) {
        setFontFilesDeletionTimer(0);
    }
    platform_.queues.concurrentQueue(Priority::defaultPriority).async(strayEntrySweep_);
}

Task<void> ScheduledFontDeletion::scheduleFontFilesDeletion(std::vector<std::string> paths)
{
    if (paths.empty()) {
        co_return;
    }
    const auto self = shared_from_this();
    const auto seconds = delay();
    Task<void> turn = recordings_->wait();
    co_await std::move(turn);
    post([paths = std::move(paths), seconds, recordings = recordings_](ScheduledFontDeletion& deletion) {
        deletion.record(paths, seconds);
        recordings->signal();
    });
}

std::uint32_t ScheduledFontDeletion::delay()
{
    const auto chosen = platform_.preferences.number("deleteDelay");
    if (chosen > 0.0) {
        return wholeSeconds(chosen);
    }
    return platform_.isInternalBuild ? defaultDelayOfInternalBuild : defaultDelay;
}

void ScheduledFontDeletion::record(const std::vector<std::string>& paths, std::uint32_t delay)
{
    const auto withoutRoom = schedule_.record(paths, Date{platform_.clock.now() + delay});
    if (withoutRoom != 0 && !hasComplained_) {
        TYLog_Error(platform_.log, "the deletion schedule is full: of " + std::to_string(paths.size()) +
                                       " font files, " + std::to_string(withoutRoom) +
                                       " are not scheduled; said once until there is room again");
    }
    hasComplained_ = withoutRoom != 0;
    setFontFilesDeletionTimer(delay);
}

void ScheduledFontDeletion::setFontFilesDeletionTimer(std::uint32_t seconds)
{
    post([seconds](ScheduledFontDeletion& deletion) { deletion.arm(seconds); });
}

void ScheduledFontDeletion::arm(std::uint32_t seconds)
{
    if (scheduledFontDeletionTimer_) {
        if (seconds == 0) {
            scheduledFontDeletionTimer_->schedule(std::chrono::nanoseconds::zero(), leewayOfImmediateFiring);
        }
        // Intended: any other request is ignored while a timer is held, even one that has fired.
        return;
    }
    const std::function<void(ScheduledFontDeletion&)> pass = [number = ++timers_](auto& deletion) {
        // It may have been stopped after it fired.
        if (deletion.scheduledFontDeletionTimer_ && deletion.timers_ == number) {
            deletion.executeScheduledFontFilesDeletion();
        }
    };
    scheduledFontDeletionTimer_ =
        platform_.queues.createTimer(scheduledFontDeletionQueue(), [weak = weak_from_this(), pass] {
            if (const auto self = weak.lock()) {
                pass(*self);
            }
        });
    const std::chrono::seconds quarter(seconds / 4);
    // Later by a quarter, so that the batch it is armed for is due when it fires.
    scheduledFontDeletionTimer_->schedule(std::chrono::seconds(seconds) + quarter, quarter);
}

void ScheduledFontDeletion::stopFontFilesDeletionTimer()
{
    post([](ScheduledFontDeletion& deletion) { deletion.scheduledFontDeletionTimer_.reset(); });
}

void ScheduledFontDeletion::executeScheduledFontFilesDeletion()
{
    TYLog_Debug(platform_.log, "executeScheduledFontFilesDeletion");
    const auto due = schedule_.takeDue(platform_.clock.now());
    if (due.wasEmpty) {
        TYLog_Error(platform_.log, "executeScheduledFontFilesDeletion - no files to delete.");
        stopFontFilesDeletionTimer();
        return;
    }
    if (!due.paths.empty()) {
        TYLog_Debug(platform_.log, "scheduled deletion: " + std::to_string(due.paths.size()));
        removeFontFiles(platform_.fileSystem, platform_.log, due.paths);
    }
    if (due.earliestRemaining != DueFiles::none) {
        TYLog_Debug(platform_.log,
                    "next deletion after " + std::to_string(due.earliestRemaining) + " seconds.");
        setFontFilesDeletionTimer(due.earliestRemaining);
    } else {
        TYLog_Debug(platform_.log, "all files deleted.");
        stopFontFilesDeletionTimer();
    }
}

WorkQueue& ScheduledFontDeletion::scheduledFontDeletionQueue()
{
    return platform_.processWideQueues.serialQueue("com.vorlan.typhond.scheduledFontDeletion");
}

void ScheduledFontDeletion::post(std::function<void(ScheduledFontDeletion&)> work)
{
    scheduledFontDeletionQueue().async([weak = weak_from_this(), work = std::move(work)] {
        if (const auto self = weak.lock()) {
            work(*self);
        }
    });
}

}  // namespace typhon
