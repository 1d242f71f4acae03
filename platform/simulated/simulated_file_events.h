#pragma once

#include "platform/file_events.h"
#include "platform/simulated/simulated_scheduler.h"

#include <memory>
#include <string>
#include <vector>

namespace typhon {

/// File-system events that a test makes up, batched in virtual time. One thread.
class SimulatedFileEvents final : public FileEvents {
public:
    explicit SimulatedFileEvents(SimulatedScheduler& scheduler) : scheduler_(scheduler) {}

    std::shared_ptr<FileEventStream> createStream(std::vector<std::string> paths,
                                                  std::chrono::nanoseconds latency,
                                                  Callback callback) override;

    /// Says that the file at `path` changed: the started streams that watch a directory above it will report
    /// it when their windows end.
    void change(const std::string& path);
    /// Streams that have been started and not dropped.
    std::size_t startedStreams() const;

private:
    class Stream;
    SimulatedScheduler& scheduler_;
    std::vector<std::weak_ptr<Stream>> streams_;
};

}  // namespace typhon
