#pragma once

#include "deletion/deletion_schedule.h"
#include "platform/platform.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace typhon {

/// Deletion of font files on a schedule: clients hand in paths, each batch becomes due after a delay, one
/// timer runs the passes that delete what is due. Made with `make_shared`; work that it posted and that
/// has not run ends with it. Any thread.
class ScheduledFontDeletion final : public std::enable_shared_from_this<ScheduledFontDeletion> {
public:
    /// `platform` outlives this. `strayEntrySweep` is run once, after the start-up, wherever there is a
    /// thread for it.
    ScheduledFontDeletion(Platform& platform, std::function<void()> strayEntrySweep);

    /// `setupForScheduledFontDeletion`. Has a pass run soon if anything was scheduled before this start,
    /// then starts the sweep.
    void setupForScheduledFontDeletion();

    /// `scheduleFontFilesDeletion:`. Ends when the recording of the paths is on its way; that may take until
    /// others' recordings are done.
    Task<void> scheduleFontFilesDeletion(std::vector<std::string> paths);

    /// `setFontFilesDeletionTimer:`. Seconds.
    void setFontFilesDeletionTimer(std::uint32_t seconds);
    /// `stopFontFilesDeletionTimer`
    void stopFontFilesDeletionTimer();

    /// `scheduledFontDeletionQueue`. The process's, made on first use.
    WorkQueue& scheduledFontDeletionQueue();

private:
    std::uint32_t delay();
    void record(const std::vector<std::string>& paths, std::uint32_t delay);
    void arm(std::uint32_t seconds);
    /// `executeScheduledFontFilesDeletion:`. One pass, on the deletion queue.
    void executeScheduledFontFilesDeletion();
    void post(std::function<void(ScheduledFontDeletion&)> work);

    Platform& platform_;
    const std::function<void()> strayEntrySweep_;
    /// One for each recording that may wait for its turn.
    const std::shared_ptr<Semaphore> recordings_;

    // Owned by the deletion queue.
    DeletionSchedule schedule_;
    std::unique_ptr<Timer> scheduledFontDeletionTimer_;
    /// How many timers there were; tells the handler of a stopped one from that of the present one.
    std::uint64_t timers_ = 0;
    bool hasComplained_ = false;
};

}  // namespace typhon
