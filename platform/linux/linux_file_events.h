#pragma once

#include "platform/file_events.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"
#include "platform/work_queues.h"

namespace typhon {

/// File-system event streams by inotify. Streams outlive nothing of what is given here.
class LinuxFileEvents final : public FileEvents {
public:
    LinuxFileEvents(EventPool& pool, WorkQueues& queues, Log& log, RootDirectory root)
        : pool_(pool), queues_(queues), log_(log), root_(std::move(root))
    {}

    std::shared_ptr<FileEventStream> createStream(std::vector<std::string> paths,
                                                  std::chrono::nanoseconds latency,
                                                  Callback callback) override;

private:
    EventPool& pool_;
    WorkQueues& queues_;
    Log& log_;
    const RootDirectory root_;
};

}  // namespace typhon
