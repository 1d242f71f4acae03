#include "platform/linux/linux_file_events.h"

#include "platform/linux/directory_tree_watch.h"

#include <algorithm>
#include <atomic>
#include <iterator>
#include <set>
#include <utility>

#include <fcntl.h>

// After a batch in which a directory came, went or moved, or events were lost, every tree is walked anew:
// what is new is watched and reported with its contents, and what is not there any more is let go of.

namespace typhon {

namespace {

/// Paths in one report; with more, the directories of the stream stand for all.
constexpr std::size_t mostPaths = 4096;

std::string withoutFinalSlash(std::string path)
{
    while (path.size() > 1 && path.ends_with('/')) {
        path.pop_back();
    }
    return path;
}

class Stream final : public FileEventStream, public std::enable_shared_from_this<Stream> {
public:
    struct Services {
        EventPool& pool;
        WorkQueues& queues;
        Log& log;
        const RootDirectory& root;
    };

    Stream(Services services, std::vector<std::string> paths, std::chrono::nanoseconds latency,
           FileEvents::Callback callback)
        : services_(services), latency_(latency), callback_(std::move(callback))
    {
        for (auto& path : paths) {
            paths_.push_back(withoutFinalSlash(std::move(path)));
            trees_.emplace_back(services.root, paths_.back(), services.log);
        }
    }

    void setDispatchQueue(std::shared_ptr<WorkQueue> queue) override { queue_ = std::move(queue); }
    void start() override
    {
        if (queue_ && !isStarted_.exchange(true)) {
            queue_->async([weak = weak_from_this()] {
                if (const auto self = weak.lock()) {
                    self->begin();
                }
            });
        }
    }

private:
    void begin()
    {
        watch_ =
            std::make_shared<DirectoryWatch>(services_.pool, services_.queues, queue_, latency_,
                                             [weak = weak_from_this()](const DirectoryWatch::Batch& batch) {
                                                 if (const auto self = weak.lock()) {
                                                     self->take(batch);
                                                 }
                                             });
        walk();
    }

    /// Gives what is watched for the first time, with its files.
    std::set<std::string> walk()
    {
        std::set<std::string> seen;
        std::set<std::string> appeared;
        for (auto& tree : trees_) {
            tree.watchAll(*watch_, seen, appeared);
        }
        watch_->keepOnly(seen);
        return appeared;
    }

    bool isInTrees(const std::string& path) const
    {
        return std::ranges::any_of(trees_, [&](const auto& tree) { return tree.covers(path); });
    }

    /// Whether the directories that have to be watched are others now.
    bool changesDirectories(const std::string& path) const
    {
        const FileDescriptor directory(::open(path.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        return directory || watch_->isWatched(path) || !isInTrees(path);
    }

    void take(const DirectoryWatch::Batch& batch)
    {
        std::set<std::string> changed;
        std::ranges::copy_if(batch.paths, std::inserter(changed, changed.end()),
                             [&](const auto& path) { return isInTrees(path); });
        if (batch.mustRescan ||
            std::ranges::any_of(batch.paths, [&](const auto& path) { return changesDirectories(path); })) {
            changed.merge(walk());
        }
        if (batch.mustRescan || changed.size() > mostPaths) {
            callback_(paths_);
        } else if (!changed.empty()) {
            report(changed);
        }
    }

    void report(const std::set<std::string>& changed) const
    {
        std::vector<std::string> logical;
        logical.reserve(changed.size());
        for (const auto& path : changed) {
            logical.push_back(path.substr(services_.root.directory().size()));
        }
        callback_(std::move(logical));
    }

    const Services services_;
    const std::chrono::nanoseconds latency_;
    const FileEvents::Callback callback_;
    std::vector<std::string> paths_;
    std::shared_ptr<WorkQueue> queue_;
    std::atomic<bool> isStarted_ = false;

    // Owned by the queue.
    std::vector<DirectoryTreeWatch> trees_;
    std::shared_ptr<DirectoryWatch> watch_;
};

}  // namespace

std::shared_ptr<FileEventStream> LinuxFileEvents::createStream(std::vector<std::string> paths,
                                                               std::chrono::nanoseconds latency,
                                                               Callback callback)
{
    return std::make_shared<Stream>(Stream::Services{pool_, queues_, log_, root_}, std::move(paths), latency,
                                    std::move(callback));
}

}  // namespace typhon
