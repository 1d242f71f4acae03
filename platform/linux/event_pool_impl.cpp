// The pool's threads.
//
// Every thread alternates between the job queue and the epoll set. Descriptors are watched one-shot, so
// the kernel hands each event to one thread. Jobs are announced through an edge-triggered eventfd, which
// wakes one thread; that one wakes the next as long as jobs are left. The thread that would leave nobody
// waiting starts another, up to the cap; threads are kept once started.
//
// Events carry an identifier that is never reused, not a pointer or a descriptor: one that arrives after
// its watch has gone finds nothing.

#include "platform/linux/event_pool_impl.h"

#include <cerrno>
#include <csignal>
#include <system_error>
#include <utility>

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr std::uint64_t wakeId = 0;
constexpr std::uint64_t stopId = 1;
constexpr std::uint64_t firstWatchId = 2;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr std::size_t stackSize = 8U << 20U;
#else
constexpr std::size_t stackSize = 512U << 10U;
#endif

/// Nanoseconds.
constexpr std::uint64_t shortTurn = 100'000;

thread_local const void* currentPool = nullptr;

/// The kernel's `struct sched_attr`, which the C library does not have.
struct SchedulingAttributes {
    std::uint32_t size;
    std::uint32_t policy;
    std::uint64_t flags;
    std::int32_t nice;
    std::uint32_t priority;
    std::uint64_t runtime;
    std::uint64_t deadline;
    std::uint64_t period;
};

/// Whoever is woken while this thread works for another has to wait no longer than that. Linux 6.12 has it,
/// older kernels take no notice.
void requestShortTurns()
{
    SchedulingAttributes attributes{};
    attributes.size = sizeof attributes;
    if (::syscall(SYS_sched_getattr, 0, &attributes, sizeof attributes, 0) == 0) {
        attributes.runtime = shortTurn;
        (void)::syscall(SYS_sched_setattr, 0, &attributes, 0);
    }
}

/// Null when it is gone.
std::shared_ptr<EventPool::Handler> strong(const EventPool::Impl::HeldHandler& handler)
{
    if (const auto* kept = std::get_if<std::shared_ptr<EventPool::Handler>>(&handler)) {
        return *kept;
    }
    return std::get<std::weak_ptr<EventPool::Handler>>(handler).lock();
}

int checked(int result, const char* what)
{
    if (result < 0) {
        throw std::system_error(errno, std::generic_category(), what);
    }
    return result;
}

void addToEpoll(int epoll, int descriptor, std::uint32_t events, std::uint64_t id)
{
    epoll_event event{};
    event.events = events;
    event.data.u64 = id;
    checked(epoll_ctl(epoll, EPOLL_CTL_ADD, descriptor, &event), "epoll_ctl");
}

}  // namespace

EventPool::Impl::Impl(Options options)
    : options_(options), epoll_(checked(epoll_create1(EPOLL_CLOEXEC), "epoll_create1")),
      wake_(checked(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK), "eventfd")),
      stop_(checked(eventfd(1, EFD_CLOEXEC | EFD_NONBLOCK), "eventfd")), nextId_(firstWatchId)
{
    addToEpoll(epoll_.get(), wake_.get(), EPOLLIN | EPOLLET, wakeId);
}

void EventPool::Impl::start()
{
    for (unsigned started = 0; started < options_.minimumThreads; ++started) {
        {
            const std::lock_guard lock(mutex_);
            ++threads_;
        }
        if (!createThread() && started == 0) {
            throw std::system_error(EAGAIN, std::generic_category(), "pthread_create");
        }
    }
}

void EventPool::Impl::stop()
{
    std::unique_lock lock(mutex_);
    if (!std::exchange(stopping_, true)) {
        // Level-triggered and never read, so that it reaches every thread.
        addToEpoll(epoll_.get(), stop_.get(), EPOLLIN, stopId);
    }
    while (!handles_.empty()) {
        const pthread_t handle = handles_.back();
        handles_.pop_back();
        lock.unlock();
        pthread_join(handle, nullptr);
        lock.lock();
    }
    const auto droppedJobs = std::exchange(jobs_, {});
    const auto droppedHandlers = std::exchange(handlers_, {});
    lock.unlock();
}

void EventPool::Impl::post(Job job)
{
    std::unique_lock lock(mutex_);
    if (stopping_) {
        lock.unlock();
        return;
    }
    jobs_.push_back(std::move(job));
    wakeOne(lock);
}

std::uint64_t EventPool::Impl::add(HeldHandler handler)
{
    const std::lock_guard lock(mutex_);
    handlers_.emplace(nextId_, std::move(handler));
    return nextId_++;
}

void EventPool::Impl::remove(std::uint64_t id)
{
    std::unique_lock lock(mutex_);
    const auto removed = handlers_.extract(id);
    lock.unlock();
}

unsigned EventPool::Impl::threadCount() const
{
    const std::lock_guard lock(mutex_);
    return threads_;
}

bool EventPool::Impl::isPoolThread() const
{
    return currentPool == this;
}

void* EventPool::Impl::threadMain(void* self)
{
    const std::unique_ptr<std::shared_ptr<Impl>> impl(static_cast<std::shared_ptr<Impl>*>(self));
    requestShortTurns();
    currentPool = impl->get();
    (*impl)->work();
    return nullptr;
}

void EventPool::Impl::work()
{
    for (;;) {
        bool worked = false;
        if (Job job = beginJob()) {
            job();
            job = nullptr;
            endWork();
            worked = true;
        }
        {
            const std::lock_guard lock(mutex_);
            if (stopping_) {
                return;
            }
        }
        waitForEvent(!worked);
    }
}

EventPool::Impl::Job EventPool::Impl::beginJob()
{
    std::unique_lock lock(mutex_);
    if (stopping_ || jobs_.empty()) {
        return nullptr;
    }
    Job job = std::move(jobs_.front());
    jobs_.pop_front();
    beginWork(lock);
    return job;
}

void EventPool::Impl::waitForEvent(bool block)
{
    epoll_event event{};
    if (epoll_wait(epoll_.get(), &event, 1, block ? -1 : 0) != 1) {
        return;
    }
    if (event.data.u64 == wakeId) {
        std::uint64_t count = 0;
        // Emptied before wakePending_ is cleared, or a write in between could go unnoticed.
        (void)!::read(wake_.get(), &count, sizeof count);
        const std::lock_guard lock(mutex_);
        wakePending_ = false;
    } else if (event.data.u64 != stopId) {
        dispatch(event.data.u64, event.events);
    }
}

void EventPool::Impl::dispatch(std::uint64_t id, std::uint32_t events)
{
    std::shared_ptr<Handler> handler;
    {
        std::unique_lock lock(mutex_);
        const auto found = handlers_.find(id);
        handler = found == handlers_.end() || stopping_ ? nullptr : strong(found->second);
        if (!handler) {
            return;
        }
        beginWork(lock);
    }
    handler->handleEvents(events);
    handler.reset();
    endWork();
}

void EventPool::Impl::beginWork(std::unique_lock<std::mutex>& lock)
{
    ++working_;
    const bool nobodyWaits = working_ == threads_ && threads_ < options_.maximumThreads;
    if (nobodyWaits) {
        ++threads_;
    }
    if (!jobs_.empty()) {
        wakeOne(lock);
    } else {
        lock.unlock();
    }
    if (nobodyWaits) {
        createThread();
    }
}

void EventPool::Impl::endWork()
{
    const std::lock_guard lock(mutex_);
    --working_;
}

void EventPool::Impl::wakeOne(std::unique_lock<std::mutex>& lock)
{
    const bool wake = !wakePending_ && working_ < threads_;
    wakePending_ = wakePending_ || wake;
    lock.unlock();
    if (wake) {
        const std::uint64_t one = 1;
        (void)!::write(wake_.get(), &one, sizeof one);
    }
}

bool EventPool::Impl::createThread()
{
    pthread_attr_t attributes;
    pthread_attr_init(&attributes);
    pthread_attr_setstacksize(&attributes, stackSize);
    // Signals are the main thread's business.
    sigset_t all;
    sigset_t previous;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &previous);

    std::unique_lock lock(mutex_);
    auto self = std::make_unique<std::shared_ptr<Impl>>(shared_from_this());
    pthread_t handle{};
    const bool created = !stopping_ && pthread_create(&handle, &attributes, threadMain, self.get()) == 0;
    if (created) {
        (void)self.release();
        pthread_setname_np(handle, "typhon-pool");
        handles_.push_back(handle);
    } else {
        --threads_;
    }
    lock.unlock();
    pthread_sigmask(SIG_SETMASK, &previous, nullptr);
    pthread_attr_destroy(&attributes);
    return created;
}

}  // namespace typhon
