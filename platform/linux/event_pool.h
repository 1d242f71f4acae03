#pragma once

#include <cstdint>
#include <functional>
#include <memory>

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

    /// Threads running at present, and the most there may be.
    unsigned threadCount() const;
    unsigned maximumThreads() const;
    /// True on a thread of this pool.
    bool isPoolThread() const;

    class Impl;

private:
    std::shared_ptr<Impl> impl_;
};

}  // namespace typhon
