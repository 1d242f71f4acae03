#pragma once

#include "platform/linux/event_pool.h"
#include "platform/linux/file_descriptor.h"

#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <variant>
#include <vector>

#include <pthread.h>

namespace typhon {

/// What the pool's threads, its watches and the `EventPool` itself share.
class EventPool::Impl : public std::enable_shared_from_this<EventPool::Impl> {
public:
    using Job = std::function<void()>;
    /// Kept alive by others, or by the pool.
    using HeldHandler = std::variant<std::weak_ptr<Handler>, std::shared_ptr<Handler>>;

    explicit Impl(Options options);

    void start();
    /// Lets the threads finish what they run, joins them and drops the remaining jobs.
    void stop();
    void post(Job job);

    /// The identifier under which events of a new watch arrive; never used again.
    std::uint64_t add(HeldHandler handler);
    void remove(std::uint64_t id);
    int epoll() const { return epoll_.get(); }

    unsigned threadCount() const;
    unsigned maximumThreads() const { return options_.maximumThreads; }
    bool isPoolThread() const;

private:
    static void* threadMain(void* self);
    void work();
    /// Takes the next job, marking the thread as working; null when there is none.
    Job beginJob();
    void waitForEvent(bool block);
    void dispatch(std::uint64_t id, std::uint32_t events);
    void beginWork(std::unique_lock<std::mutex>& lock);
    void endWork();
    void wakeOne(std::unique_lock<std::mutex>& lock);
    bool createThread();

    const Options options_;
    const FileDescriptor epoll_;
    const FileDescriptor wake_;
    const FileDescriptor stop_;

    mutable std::mutex mutex_;
    // All below is protected by mutex_.
    std::deque<Job> jobs_;
    std::unordered_map<std::uint64_t, HeldHandler> handlers_;
    std::uint64_t nextId_;
    std::vector<pthread_t> handles_;
    unsigned threads_ = 0;
    unsigned working_ = 0;
    bool wakePending_ = false;
    bool stopping_ = false;
};

}  // namespace typhon
