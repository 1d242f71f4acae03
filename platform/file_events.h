#pragma once

#include "platform/work_queue.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace typhon {

/// Reports changed files below some directories, at any depth, from its start on. Dropping the stream ends
/// it. Any thread.
class FileEventStream {
public:
    virtual ~FileEventStream() = default;
    /// The serial queue that the callback runs on. Before `start`.
    virtual void setDispatchQueue(std::shared_ptr<WorkQueue> queue) = 0;
    /// Begins. Nothing is reported for what was there before. Later calls do nothing.
    virtual void start() = 0;
};

/// File-system event streams. Any thread. Outlives its streams.
class FileEvents {
public:
    /// The changed paths of one batch, sorted, each once; in doubt the path of a directory that has to be
    /// looked at anew. Never empty.
    using Callback = std::function<void(std::vector<std::string> paths)>;

    virtual ~FileEvents() = default;
    /// A stream of events of individual files below `paths` (logical paths of directories, which need not be
    /// there yet, and may go and come back). Everything within `latency` from the first event is one batch.
    virtual std::shared_ptr<FileEventStream>
    createStream(std::vector<std::string> paths, std::chrono::nanoseconds latency, Callback callback) = 0;
};

}  // namespace typhon
