#pragma once

#include "platform/linux/event_pool.h"
#include "platform/linux/file_descriptor.h"
#include "platform/work_queues.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

struct inotify_event;

namespace typhon {

/// Tells when names in directories appear, change or go, in batches: everything within a fixed time from the
/// first event is one batch. Does not look into directories below. To see everything, watch a directory first
/// and list it afterwards; then some changes are seen twice, and none is missed.
///
/// Hold it by a shared pointer; dropping that ends it. On its queue only, but for the construction.
class DirectoryWatch : public std::enable_shared_from_this<DirectoryWatch> {
public:
    struct Batch {
        /// What changed: the watched directory's path, "/", and the name. Sorted, each once.
        std::vector<std::string> paths;
        /// Events were lost, or a watched directory went away or moved: everything has to be watched and
        /// listed again.
        bool mustRescan = false;
    };
    enum class Outcome {
        /// Is watched from now on: list it now.
        added,
        /// Was watched already.
        known,
        failed
    };

    /// The services outlive everything on the queue. `handler` runs on `queue`.
    DirectoryWatch(EventPool& pool, WorkQueues& queues, std::shared_ptr<WorkQueue> queue,
                   std::chrono::nanoseconds batchTime, std::function<void(Batch)> handler);
    DirectoryWatch(const DirectoryWatch&) = delete;
    DirectoryWatch& operator=(const DirectoryWatch&) = delete;
    ~DirectoryWatch();

    /// Watches an open directory, which stays the caller's, under the name `path`. With `onlyName`, reports
    /// that name alone (and those asked for in other calls). When the path leads to another directory by now,
    /// that takes the place of the one before. On failure errno says why.
    Outcome watch(const std::string& path, int directory, const std::string& onlyName = {});
    /// Ends all other watches.
    void keepOnly(const std::set<std::string>& paths);
    bool isWatched(const std::string& path) const { return watchByPath_.contains(path); }

private:
    /// The names of interest; all when empty.
    using Names = std::set<std::string>;
    /// One directory of the kernel's, under every path it is watched as.
    using Watched = std::map<std::string, Names>;

    bool open();
    void readEvents();
    void take(const inotify_event& event);
    void note(std::string path);
    void noteRescan();
    void forgetPath(const std::string& path);
    void forgetWatch(int watch, bool isGone);
    void beginBatch();
    void endBatch();

    EventPool& pool_;
    WorkQueues& queues_;
    const std::shared_ptr<WorkQueue> queue_;
    const std::chrono::nanoseconds batchTime_;
    const std::function<void(Batch)> handler_;

    // Owned by the queue.
    FileDescriptor inotify_;
    std::unique_ptr<EventPool::Watch> readable_;
    std::unique_ptr<Timer> batchEnd_;
    std::map<int, Watched> watches_;
    std::map<std::string, int> watchByPath_;
    bool inBatch_ = false;
    std::set<std::string> changed_;
    bool mustRescan_ = false;
};

}  // namespace typhon
