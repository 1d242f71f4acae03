#pragma once

#include "platform/log.h"
#include "platform/work_queues.h"

#include <chrono>
#include <memory>
#include <string>

namespace typhon {

/// Says in the log when reading a file takes so long that something must be wrong with the file system it is
/// on: nothing can be done about a thread that waits in the kernel, but nobody should have to guess. Any
/// thread.
class SlowReads {
public:
    static constexpr std::chrono::seconds patience{5};

    SlowReads(WorkQueues& queues, Log& log)
        : queues_(queues), log_(log), queue_(queues.createSerialQueue("com.vorlan.typhond.slowReads"))
    {}

    /// Keep the result for as long as the reading of `path` takes.
    std::shared_ptr<void> watch(const std::string& path) const;

private:
    WorkQueues& queues_;
    Log& log_;
    const std::shared_ptr<WorkQueue> queue_;
};

}  // namespace typhon
