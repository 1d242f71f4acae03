#pragma once

#include "platform/work_queues.h"

#include <chrono>
#include <memory>
#include <mutex>

namespace typhon {

/// Gives free memory back to the system some time after connections were closed: the allocator keeps what
/// many of them took, for the many that may never come again. Any thread.
class MemoryReturn : public std::enable_shared_from_this<MemoryReturn> {
public:
    /// Not at all when `delay` is zero. `queue` is where it is done.
    MemoryReturn(WorkQueues& queues, std::shared_ptr<WorkQueue> queue, std::chrono::nanoseconds delay)
        : queues_(queues), queue_(std::move(queue)), delay_(delay)
    {}

    /// A connection was closed. However many are, memory is given back once in each `delay`.
    void connectionClosed();

private:
    void giveBack();

    WorkQueues& queues_;
    const std::shared_ptr<WorkQueue> queue_;
    const std::chrono::nanoseconds delay_;
    std::mutex mutex_;
    std::unique_ptr<Timer> timer_;
    bool scheduled_ = false;
};

}  // namespace typhon
