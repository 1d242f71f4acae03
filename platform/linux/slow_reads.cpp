#include "platform/linux/slow_reads.h"

#include <utility>

namespace typhon {

namespace {

/// Ends the timer when the reading has ended.
class WatchedRead {
public:
    WatchedRead(std::unique_ptr<Timer> timer, std::shared_ptr<WorkQueue> queue)
        : timer_(std::move(timer)), queue_(std::move(queue))
    {
        timer_->schedule(SlowReads::patience, SlowReads::patience / 50);
    }
    ~WatchedRead()
    {
        timer_->cancel();
        // It must outlive its own handler.
        const std::function<void()> dispose = [keep = std::shared_ptr<Timer>(std::move(timer_))] {};
        queue_->async(dispose);
    }
    WatchedRead(const WatchedRead&) = delete;
    WatchedRead& operator=(const WatchedRead&) = delete;

private:
    std::unique_ptr<Timer> timer_;
    const std::shared_ptr<WorkQueue> queue_;
};

}  // namespace

std::shared_ptr<void> SlowReads::watch(const std::string& path) const
{
    auto timer = queues_.createTimer(*queue_, [&log = log_, path] {
        TYLog_Error(log, "reading " + path + " takes longer than " + std::to_string(patience.count()) +
                             " s, and whoever needs it waits: the file system that it is on stalls (keep it "
                             "on a local disk)");
    });
    return std::make_shared<WatchedRead>(std::move(timer), queue_);
}

}  // namespace typhon
