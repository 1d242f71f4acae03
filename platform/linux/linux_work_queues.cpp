#include "platform/linux/linux_work_queues.h"

#include "platform/linux/linux_semaphore.h"
#include "platform/linux/linux_timer.h"

#include <algorithm>
#include <iterator>
#include <mutex>
#include <utility>
#include <vector>

namespace typhon {

/// The serial queues that exist, for `close`.
class LinuxWorkQueues::Registry {
public:
    /// A place in the list.
    struct Place {
        Place() = default;
        Place(const Place&) = delete;
        Place& operator=(const Place&) = delete;

        Place* previous = this;
        Place* next = this;
    };

    /// False once it is closed.
    bool add(Place& queue);
    void remove(Place& queue);
    /// All of them that anybody holds. Takes no more.
    std::vector<std::shared_ptr<LinuxQueue>> close();

private:
    std::mutex mutex_;
    Place ends_;
    bool closed_ = false;
};

/// It is listed by itself, as long as it is there: that may be longer than somebody but its items holds it.
class LinuxWorkQueues::ListedQueue final : public LinuxSerialQueue, public Registry::Place {
public:
    ListedQueue(std::string label, std::shared_ptr<Executor> executor, std::shared_ptr<Registry> registry)
        : LinuxSerialQueue(std::move(label), std::move(executor)), registry_(std::move(registry))
    {}
    ~ListedQueue() override { registry_->remove(*this); }

private:
    const std::shared_ptr<Registry> registry_;
};

bool LinuxWorkQueues::Registry::add(Place& queue)
{
    const std::lock_guard lock(mutex_);
    if (closed_) {
        return false;
    }
    queue.previous = &ends_;
    queue.next = ends_.next;
    ends_.next->previous = &queue;
    ends_.next = &queue;
    return true;
}

void LinuxWorkQueues::Registry::remove(Place& queue)
{
    const std::lock_guard lock(mutex_);
    queue.previous->next = queue.next;
    queue.next->previous = queue.previous;
}

std::vector<std::shared_ptr<LinuxQueue>> LinuxWorkQueues::Registry::close()
{
    const std::lock_guard lock(mutex_);
    closed_ = true;
    std::vector<std::shared_ptr<LinuxQueue>> queues;
    for (auto* place = ends_.next; place != &ends_; place = place->next) {
        // One that is about to unlist itself can be held no more.
        if (auto queue = static_cast<ListedQueue*>(place)->weak_from_this().lock()) {
            queues.push_back(std::move(queue));
        }
    }
    return queues;
}

LinuxWorkQueues::LinuxWorkQueues(EventPool& pool)
    : pool_(std::make_shared<PoolExecutor>(pool)),
      backgroundPool_(std::make_shared<LimitedExecutor>(pool, std::max(1U, pool.maximumThreads() / 2))),
      timers_(std::make_shared<TimerService>(pool)),
      mainQueue_(std::make_shared<LinuxMainQueue>("com.vorlan.main-thread", mainLoop_)),
      default_(std::make_shared<LinuxConcurrentQueue>("com.vorlan.root.default-qos", pool_)),
      background_(std::make_shared<LinuxConcurrentQueue>("com.vorlan.root.background-qos", backgroundPool_)),
      registry_(std::make_shared<Registry>())
{}

LinuxWorkQueues::~LinuxWorkQueues()
{
    close();
}

std::shared_ptr<WorkQueue> LinuxWorkQueues::createSerialQueue(std::string label)
{
    auto queue = std::make_shared<ListedQueue>(std::move(label), pool_, registry_);
    if (!registry_->add(*queue)) {
        queue->close();
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
    std::ranges::move(registry_->close(), std::back_inserter(open));
    timers_->close();
    for (const auto& queue : open) {
        queue->close();
    }
    backgroundPool_->dropBacklog();
    mainLoop_->drop();
}

}  // namespace typhon
