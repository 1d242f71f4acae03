#include "platform/linux/event_pool.h"

#include "platform/linux/event_pool_impl.h"

#include <algorithm>
#include <cerrno>
#include <mutex>
#include <system_error>
#include <utility>

#include <sys/epoll.h>

namespace typhon {

namespace {

class FunctionHandler final : public EventPool::Handler {
public:
    explicit FunctionHandler(std::function<void(std::uint32_t)> function) : function_(std::move(function)) {}
    void handleEvents(std::uint32_t events) override { function_(events); }

private:
    const std::function<void(std::uint32_t)> function_;
};

class FunctionWatch final : public EventPool::Watch {
public:
    explicit FunctionWatch(EventPool::HandlerWatch watch) : watch_(std::move(watch)) {}
    void arm(std::uint32_t events) override
    {
        const std::lock_guard lock(mutex_);
        watch_.arm(events);
    }

private:
    std::mutex mutex_;
    EventPool::HandlerWatch watch_;
};

EventPool::Options sane(EventPool::Options options)
{
    options.minimumThreads = std::max(options.minimumThreads, 1U);
    options.maximumThreads = std::max(options.maximumThreads, options.minimumThreads);
    return options;
}

}  // namespace

EventPool::HandlerWatch::HandlerWatch(std::shared_ptr<Impl> pool, int descriptor, std::uint64_t id)
    : pool_(std::move(pool)), id_(id), descriptor_(descriptor)
{}

EventPool::HandlerWatch::~HandlerWatch()
{
    if (added_) {
        epoll_ctl(pool_->epoll(), EPOLL_CTL_DEL, descriptor_, nullptr);
    }
    if (pool_) {
        pool_->remove(id_);
    }
}

void EventPool::HandlerWatch::swap(HandlerWatch& other) noexcept
{
    pool_.swap(other.pool_);
    std::swap(id_, other.id_);
    std::swap(descriptor_, other.descriptor_);
    std::swap(added_, other.added_);
}

void EventPool::HandlerWatch::arm(std::uint32_t events)
{
    epoll_event event{};
    event.events = events | EPOLLONESHOT;
    event.data.u64 = id_;
    // Added with the first arming only: epoll reports errors and hang-ups whether asked for or not.
    const int operation = std::exchange(added_, true) ? EPOLL_CTL_MOD : EPOLL_CTL_ADD;
    if (epoll_ctl(pool_->epoll(), operation, descriptor_, &event) < 0) {
        throw std::system_error(errno, std::generic_category(), "epoll_ctl");
    }
}

EventPool::EventPool(Options options) : impl_(std::make_shared<Impl>(sane(options)))
{
    impl_->start();
}

EventPool::~EventPool()
{
    impl_->stop();
}

void EventPool::stop()
{
    impl_->stop();
}

void EventPool::post(std::function<void()> job)
{
    impl_->post(std::move(job));
}

std::unique_ptr<EventPool::Watch> EventPool::watch(int descriptor, std::function<void(std::uint32_t)> handler)
{
    std::shared_ptr<Handler> kept = std::make_shared<FunctionHandler>(std::move(handler));
    return std::make_unique<FunctionWatch>(HandlerWatch(impl_, descriptor, impl_->add(std::move(kept))));
}

EventPool::HandlerWatch EventPool::watch(int descriptor, std::weak_ptr<Handler> handler)
{
    return HandlerWatch(impl_, descriptor, impl_->add(std::move(handler)));
}

unsigned EventPool::threadCount() const
{
    return impl_->threadCount();
}

unsigned EventPool::maximumThreads() const
{
    return impl_->maximumThreads();
}

bool EventPool::isPoolThread() const
{
    return impl_->isPoolThread();
}

}  // namespace typhon
