#include "platform/simulated/simulated_work_queues.h"

#include "platform/simulated/simulated_semaphore.h"
#include "platform/simulated/simulated_timer.h"

#include <utility>
#include <vector>

namespace typhon {

/// The queues that exist, for `close`.
struct SimulatedWorkQueues::Registry {
    std::unordered_map<const SimulatedQueue*, std::weak_ptr<SimulatedQueue>> queues;
    bool closed = false;
};

SimulatedWorkQueues::SimulatedWorkQueues(SimulatedScheduler& scheduler)
    : scheduler_(scheduler), registry_(std::make_shared<Registry>()),
      main_(createQueue("com.vorlan.main-thread", true)),
      default_(createQueue("com.vorlan.root.default-qos", false)),
      background_(createQueue("com.vorlan.root.background-qos", false))
{}

SimulatedWorkQueues::~SimulatedWorkQueues()
{
    close();
}

std::shared_ptr<SimulatedQueue> SimulatedWorkQueues::createQueue(std::string label, bool serial)
{
    // Unlisted by its deleter: a queue that items still hold stays listed as long as it is there.
    const auto forget = [registry = registry_](SimulatedQueue* queue) {
        registry->queues.erase(queue);
        delete queue;
    };
    std::shared_ptr<SimulatedQueue> queue(new SimulatedQueue(scheduler_, std::move(label), serial), forget);
    registry_->queues.emplace(queue.get(), queue);
    if (registry_->closed) {
        queue->close();
    }
    return queue;
}

std::shared_ptr<WorkQueue> SimulatedWorkQueues::createSerialQueue(std::string label)
{
    return createQueue(std::move(label), true);
}

WorkQueue& SimulatedWorkQueues::concurrentQueue(Priority priority)
{
    return priority == Priority::background ? *background_ : *default_;
}

std::shared_ptr<Semaphore> SimulatedWorkQueues::createSemaphore(unsigned initialCount)
{
    return std::make_shared<SimulatedSemaphore>(initialCount);
}

std::unique_ptr<Timer> SimulatedWorkQueues::createTimer(WorkQueue& queue, std::function<void()> handler)
{
    return std::make_unique<SimulatedTimer>(scheduler_, queue, std::move(handler));
}

namespace {

Task<void> pauseOn(SimulatedScheduler& scheduler, std::chrono::nanoseconds duration)
{
    std::function<void(std::function<void()>)> begin = [&scheduler, duration](std::function<void()> done) {
        scheduler.schedule(duration, std::move(done));
    };
    co_await awaitCompletion<void>(std::move(begin));
}

}  // namespace

Task<void> SimulatedWorkQueues::pause(std::chrono::nanoseconds duration)
{
    return pauseOn(scheduler_, duration);
}

std::size_t SimulatedWorkQueues::itemCount() const
{
    std::size_t count = 0;
    for (const auto& [key, queue] : registry_->queues) {
        const auto held = queue.lock();
        count += held ? held->itemCount() : 0;
    }
    return count;
}

void SimulatedWorkQueues::close()
{
    registry_->closed = true;
    std::vector<std::shared_ptr<SimulatedQueue>> open;
    for (const auto& [key, queue] : registry_->queues) {
        if (auto held = queue.lock()) {
            open.push_back(std::move(held));
        }
    }
    for (const auto& queue : open) {
        queue->close();
    }
}

}  // namespace typhon
