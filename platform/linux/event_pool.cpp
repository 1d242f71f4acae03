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

class PoolWatch final : public EventPool::Watch {
public:
    PoolWatch(std::shared_ptr<EventPool::Impl> pool, int descriptor, std::uint64_t id)
        : pool_(std::move(pool)), descriptor_(descriptor), id_(id)
    {}
    ~PoolWatch() override
    {
        if (added_) {
            epoll_ctl(pool_->epoll(), EPOLL_CTL_DEL, descriptor_, nullptr);
        }
        pool_->remove(id_);
    }

    void arm(std::uint32_t events) override
    {
        const std::lock_guard lock(mutex_);
        epoll_event event{};
        event.events = events | EPOLLONESHOT;
        event.data.u64 = id_;
        // Added with the first arming only: epoll reports errors and hang-ups whether asked for or not.
        const int operation = std::exchange(added_, true) ? EPOLL_CTL_MOD : EPOLL_CTL_ADD;
        if (epoll_ctl(pool_->epoll(), operation, descriptor_, &event) < 0) {
            throw std::system_error(errno, std::generic_category(), "epoll_ctl");
        }
    }

private:
    const std::shared_ptr<EventPool::Impl> pool_;
    const int descriptor_;
    const std::uint64_t id_;
    std::mutex mutex_;
    bool added_ = false;
};

EventPool::Options sane(EventPool::Options options)
{
    options.minimumThreads = std::max(options.minimumThreads, 1U);
    options.maximumThreads = std::max(options.maximumThreads, options.minimumThreads);
    return options;
}

}  // namespace

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
    return std::make_unique<PoolWatch>(impl_, descriptor, impl_->add(std::move(handler)));
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
