#include "platform/linux/linux_work_queues.h"

#include "platform/linux/linux_semaphore.h"
#include "platform/linux/linux_timer.h"

#include <algorithm>
#include <utility>
#include <vector>

namespace typhon {

LinuxWorkQueues::LinuxWorkQueues(EventPool& pool)
    : pool_(std::make_shared<PoolExecutor>(pool)),
      backgroundPool_(std::make_shared<LimitedExecutor>(pool, std::max(1U, pool.maximumThreads() / 2))),
      timers_(std::make_shared<TimerService>(pool)),
      mainQueue_(std::make_shared<LinuxMainQueue>("com.vorlan.main-thread", mainLoop_)),
      default_(std::make_shared<LinuxConcurrentQueue>("com.vorlan.root.default-qos", pool_)),
      background_(std::make_shared<LinuxConcurrentQueue>("com.vorlan.root.background-qos", backgroundPool_))
{}

LinuxWorkQueues::~LinuxWorkQueues()
{
    close();
}

std::shared_ptr<WorkQueue> LinuxWorkQueues::createSerialQueue(std::string label)
{
    // Unlisted by its deleter: a queue that items still hold stays listed as long as it is there.
    const auto forget = [registry = registry_](LinuxSerialQueue* queue) {
        {
            const std::lock_guard lock(registry->mutex);
            registry->queues.erase(queue);
        }
        delete queue;
    };
    const std::shared_ptr<LinuxSerialQueue> queue(new LinuxSerialQueue(std::move(label), pool_), forget);
    const std::lock_guard lock(registry_->mutex);
    if (registry_->closed) {
        queue->close();
    } else {
        registry_->queues.emplace(queue.get(), queue);
    }
    return queue;
}

WorkQueue& LinuxWorkQueues::concurrentQueue(Priority priority)
{
    return priority == Priority::background ? *background_ : *default_;
}

WorkQueue& LinuxWorkQueues::mainQueue()
{
    return *mainQueue_;
}

std::shared_ptr<Semaphore> LinuxWorkQueues::createSemaphore(unsigned initialCount)
{
    return std::make_shared<LinuxSemaphore>(initialCount);
}

std::unique_ptr<Timer> LinuxWorkQueues::createTimer(WorkQueue& queue, std::function<void()> handler)
{
    return std::make_unique<LinuxTimer>(timers_, queue, std::move(handler));
}

Task<void> LinuxWorkQueues::pauseWith(std::shared_ptr<TimerService> timers, std::chrono::nanoseconds duration)
{
    std::function<void(std::function<void()>)> begin = [timers, duration](std::function<void()> done) {
        timers->schedule(duration, std::chrono::nanoseconds::zero(), std::move(done));
    };
    co_await awaitCompletion<void>(std::move(begin));
}

Task<void> LinuxWorkQueues::pause(std::chrono::nanoseconds duration)
{
    return pauseWith(timers_, duration);
}

void LinuxWorkQueues::runMainLoop()
{
    mainLoop_->run();
}

void LinuxWorkQueues::stopMainLoop()
{
    mainLoop_->stop();
}

void LinuxWorkQueues::close()
{
    std::vector<std::shared_ptr<LinuxQueue>> open{mainQueue_, default_, background_};
    {
        const std::lock_guard lock(registry_->mutex);
        registry_->closed = true;
        for (const auto& [key, queue] : registry_->queues) {
            if (auto held = queue.lock()) {
                open.push_back(std::move(held));
            }
        }
    }
    timers_->close();
    for (const auto& queue : open) {
        queue->close();
    }
    backgroundPool_->dropBacklog();
    mainLoop_->drop();
}

}  // namespace typhon
