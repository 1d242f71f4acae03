#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <utility>

namespace typhon {

/// Threads that all wait on one epoll set: whoever is woken by a descriptor or a job handles it itself while
/// the others go on waiting, so that nothing hops between threads. Starts threads on demand, up to a hard
/// cap. Any thread.
class EventPool {
public:
    struct Options {
        unsigned minimumThreads = 2;
        unsigned maximumThreads = 16;
    };

    /// A watched descriptor. One event at a time: after the handler was called, nothing more is reported
    /// until `arm`. Destroying the watch stops it; a handler that is already running, or just about to,
    /// goes on, so it must own what it uses.
    class Watch {
    public:
        virtual ~Watch() = default;
        /// Reports the next of `events` (EPOLLIN, EPOLLOUT, ...; errors and hang-ups always).
        virtual void arm(std::uint32_t events) = 0;
    };

    class Impl;

    /// An object that events of a descriptor are reported to.
    class Handler {
    public:
        virtual ~Handler() = default;
        /// On a pool thread.
        virtual void handleEvents(std::uint32_t events) = 0;
    };

    /// A watch for handlers that are there in thousands: a part of them. Watches nothing at first. The caller
    /// locks.
    class HandlerWatch {
    public:
        HandlerWatch() = default;
        HandlerWatch(std::shared_ptr<Impl> pool, int descriptor, std::uint64_t id);
        HandlerWatch(HandlerWatch&& other) noexcept { swap(other); }
        HandlerWatch& operator=(HandlerWatch&& other) noexcept
        {
            HandlerWatch(std::move(other)).swap(*this);
            return *this;
        }
        ~HandlerWatch();
        void arm(std::uint32_t events);

    private:
        void swap(HandlerWatch& other) noexcept;

        /// Null when nothing is watched.
        std::shared_ptr<Impl> pool_;
        std::uint64_t id_ = 0;
        int descriptor_ = -1;
        bool added_ = false;
    };

    explicit EventPool(Options options);
    EventPool() : EventPool(Options{}) {}
    /// Stops.
    ~EventPool();
    EventPool(const EventPool&) = delete;
    EventPool& operator=(const EventPool&) = delete;

    /// Waits for the running jobs and handlers, and ends all threads; jobs that have not started, and all
    /// later ones, are dropped. Not on a pool thread. For a shutdown in order: afterwards nothing runs any
    /// more that could use what is destroyed next.
    void stop();

    /// Runs `job` on a pool thread. Jobs start in the order of posting.
    void post(std::function<void()> job);

    /// Watches a descriptor, which outlives the watch. Not armed yet. `handler` gets the epoll events, on a
    /// pool thread.
    std::unique_ptr<Watch> watch(int descriptor, std::function<void(std::uint32_t)> handler);
    /// The same with an object that is not kept alive. While it handles an event it is.
    HandlerWatch watch(int descriptor, std::weak_ptr<Handler> handler);

    /// Threads running at present, and the most there may be.
    unsigned threadCount() const;
    unsigned maximumThreads() const;
    /// True on a thread of this pool.
    bool isPoolThread() const;

private:
    std::shared_ptr<Impl> impl_;
};

}  // namespace typhon
