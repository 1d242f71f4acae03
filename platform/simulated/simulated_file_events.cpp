#include "platform/simulated/simulated_file_events.h"

#include <algorithm>
#include <set>
#include <utility>

namespace typhon {

namespace {

std::string withFinalSlash(const std::string& path)
{
    return path.ends_with('/') ? path : path + '/';
}

}  // namespace

class SimulatedFileEvents::Stream final : public FileEventStream,
                                          public std::enable_shared_from_this<Stream> {
public:
    Stream(SimulatedScheduler& scheduler, std::vector<std::string> paths, std::chrono::nanoseconds latency,
           Callback callback)
        : scheduler_(scheduler), paths_(std::move(paths)), latency_(latency), callback_(std::move(callback))
    {}

    void setDispatchQueue(std::shared_ptr<WorkQueue> queue) override { queue_ = std::move(queue); }
    void start() override { isStarted_ = queue_ != nullptr; }
    bool isStarted() const { return isStarted_; }

    void take(const std::string& path)
    {
        const bool isBelow = std::ranges::any_of(
            paths_, [&](const std::string& above) { return path.starts_with(withFinalSlash(above)); });
        if (!isStarted_ || !isBelow) {
            return;
        }
        if (changed_.empty()) {
            scheduler_.schedule(latency_, [weak = weak_from_this()] {
                if (const auto self = weak.lock()) {
                    self->endBatch();
                }
            });
        }
        changed_.insert(path);
    }

private:
    void endBatch()
    {
        const auto batch = std::exchange(changed_, {});
        queue_->async([weak = weak_from_this(), paths = std::vector(batch.begin(), batch.end())] {
            if (const auto self = weak.lock()) {
                self->callback_(paths);
            }
        });
    }

    SimulatedScheduler& scheduler_;
    const std::vector<std::string> paths_;
    const std::chrono::nanoseconds latency_;
    const Callback callback_;
    std::shared_ptr<WorkQueue> queue_;
    bool isStarted_ = false;
    std::set<std::string> changed_;
};

std::shared_ptr<FileEventStream> SimulatedFileEvents::createStream(std::vector<std::string> paths,
                                                                   std::chrono::nanoseconds latency,
                                                                   Callback callback)
{
    auto stream = std::make_shared<Stream>(scheduler_, std::move(paths), latency, std::move(callback));
    streams_.push_back(stream);
    return stream;
}

void SimulatedFileEvents::change(const std::string& path)
{
    for (const auto& weak : streams_) {
        if (const auto stream = weak.lock()) {
            stream->take(path);
        }
    }
}

std::size_t SimulatedFileEvents::startedStreams() const
{
    return static_cast<std::size_t>(std::ranges::count_if(streams_, [](const auto& weak) {
        const auto stream = weak.lock();
        return stream && stream->isStarted();
    }));
}

}  // namespace typhon
