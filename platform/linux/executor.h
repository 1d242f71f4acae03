#pragma once

#include "platform/linux/event_pool.h"

#include <cstddef>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <utility>

namespace typhon {

/// Where the slices of a queue's items run. Shared by the queues that use it. Any thread.
class Executor {
public:
    using Job = std::function<void()>;

    virtual ~Executor() = default;
    /// Runs `job` soon, after the jobs posted before it have started.
    virtual void post(Job job) = 0;
    /// True if the calling thread may run a slice right now.
    virtual bool isCurrentThread() const = 0;
};

/// All threads of the pool.
class PoolExecutor final : public Executor {
public:
    explicit PoolExecutor(EventPool& pool) : pool_(pool) {}
    void post(Job job) override { pool_.post(std::move(job)); }
    bool isCurrentThread() const override { return pool_.isPoolThread(); }

private:
    EventPool& pool_;
};

/// At most `limit` threads of the pool at a time; each further job goes to the end of the pool's own line.
class LimitedExecutor final : public Executor, public std::enable_shared_from_this<LimitedExecutor> {
public:
    LimitedExecutor(EventPool& pool, std::size_t limit) : pool_(pool), limit_(limit) {}

    void post(Job job) override
    {
        {
            const std::lock_guard lock(mutex_);
            if (running_ == limit_) {
                backlog_.push_back(std::move(job));
                return;
            }
            ++running_;
        }
        launch(std::move(job));
    }
    bool isCurrentThread() const override { return false; }
    /// Forgets the jobs that have not been handed to the pool.
    void dropBacklog()
    {
        std::deque<Job> dropped;
        const std::lock_guard lock(mutex_);
        dropped.swap(backlog_);
    }

private:
    void launch(Job job)
    {
        pool_.post([self = shared_from_this(), job = std::move(job)]() mutable {
            job();
            job = nullptr;
            self->finished();
        });
    }
    void finished()
    {
        Job next;
        {
            const std::lock_guard lock(mutex_);
            if (backlog_.empty()) {
                --running_;
                return;
            }
            next = std::move(backlog_.front());
            backlog_.pop_front();
        }
        launch(std::move(next));
    }

    EventPool& pool_;
    const std::size_t limit_;
    std::mutex mutex_;
    std::deque<Job> backlog_;
    std::size_t running_ = 0;
};

}  // namespace typhon
