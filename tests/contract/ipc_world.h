#pragma once

#include "platform/ipc.h"
#include "platform/work_queues.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace typhon {

/// What happened in a test, in order, from any thread.
class Notes {
public:
    using Predicate = std::function<bool(const std::vector<std::string>&)>;

    void add(std::string note)
    {
        const std::lock_guard lock(mutex_);
        notes_.push_back(std::move(note));
        changed_.notify_all();
    }
    std::vector<std::string> all() const
    {
        const std::lock_guard lock(mutex_);
        return notes_;
    }
    bool holds(const Predicate& predicate) const { return predicate(all()); }
    /// Blocks until the predicate holds; false when it does not within that time.
    bool waitFor(const Predicate& predicate, std::chrono::seconds limit)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, limit, [&] { return predicate(notes_); });
    }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<std::string> notes_;
};

inline std::size_t countOf(const std::vector<std::string>& notes, const std::string& note)
{
    return static_cast<std::size_t>(std::count(notes.begin(), notes.end(), note));
}

/// Two processes that can talk to each other: one that serves, and a client.
class IpcWorld {
public:
    virtual ~IpcWorld() = default;
    virtual Ipc& server() = 0;
    virtual Ipc& client() = 0;
    virtual WorkQueues& queues() = 0;
    virtual AuditToken serverToken() const = 0;
    virtual AuditToken clientToken() const = 0;
    /// Lets the world go on until the predicate holds; false when it never does.
    virtual bool waitUntil(Notes& notes, const Notes::Predicate& predicate) = 0;
    /// Lets time pass for a timer of that length (a simulated world only has to be asked).
    virtual void passTime(std::chrono::nanoseconds duration) = 0;
};

}  // namespace typhon
