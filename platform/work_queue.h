#pragma once

#include "platform/task.h"
#include "platform/work_item.h"

#include <exception>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <variant>

namespace typhon {

namespace detail {

/// What a task left behind: its value or its exception.
template <class T>
struct Outcome {
    using Value = std::conditional_t<std::is_void_v<T>, std::monostate, T>;
    std::optional<Value> value;
    std::exception_ptr exception;

    T take()
    {
        if (exception) {
            std::rethrow_exception(exception);
        }
        if constexpr (!std::is_void_v<T>) {
            return std::move(*value);
        }
    }
};

template <class T>
Task<void> runInto(std::shared_ptr<Outcome<T>> outcome, Task<T> work, std::function<void()> done)
{
    try {
        if constexpr (std::is_void_v<T>) {
            co_await std::move(work);
        } else {
            outcome->value.emplace(co_await std::move(work));
        }
    } catch (...) {
        outcome->exception = std::current_exception();
    }
    done();
}

template <class F>
Task<std::invoke_result_t<F>> callAsTask(F function)
{
    co_return function();
}

inline Task<void> callAsTask(std::function<void()> function)
{
    function();
    co_return;
}

}  // namespace detail

/// A queue of work. A serial queue runs one item at a time, in the order of submission, each to its end,
/// suspended or not; a concurrent queue runs as many at once as the pool allows. All operations may be
/// called from any thread. An exception that leaves posted work (as opposed to awaited work) ends the
/// process.
class WorkQueue {
public:
    WorkQueue() = default;
    virtual ~WorkQueue() = default;
    WorkQueue(const WorkQueue&) = delete;
    WorkQueue& operator=(const WorkQueue&) = delete;

    /// The queue's label, for messages and debuggers.
    virtual const std::string& label() const = 0;

    /// Appends work and returns at once. The work inherits nothing from the caller.
    void async(Task<void> work) { start(std::move(work), nullptr, nullptr); }
    void async(std::function<void()> work) { async(detail::callAsTask(std::move(work))); }

    /// Appends work that handles a message or reply of `connection`, and returns; the work may have run
    /// already, on the calling thread, if the queue was idle.
    void asyncForConnection(std::shared_ptr<void> connection, Task<void> work)
    {
        start(std::move(work), nullptr, std::move(connection));
    }

    /// Runs `work` on this queue and blocks the calling thread until it has run. Only for short work that
    /// nobody outside can prolong. Waiting for a queue that the caller itself holds, directly or through
    /// the work that awaits it, aborts with both labels in the message.
    virtual void sync(const std::function<void()>& work) = 0;

    /// Runs `work` (a task, or a function called on the queue) on this queue and suspends the calling item
    /// until it has ended; gives its value or throws its exception. Waiting for a queue that the caller
    /// itself holds aborts, as for `sync`.
    template <class T>
    Task<T> perform(Task<T> work)
    {
        WorkItem* caller = WorkItem::current();
        abortIfHeldBy(caller);
        auto outcome = std::make_shared<detail::Outcome<T>>();
        auto pending = std::make_shared<Task<T>>(std::move(work));
        std::function<void(std::function<void()>)> begin = [this, caller, outcome,
                                                            pending](std::function<void()> done) {
            start(detail::runInto<T>(outcome, std::move(*pending), std::move(done)), caller,
                  caller == nullptr ? nullptr : caller->connection);
        };
        co_await awaitCompletion<void>(std::move(begin));
        co_return outcome->take();
    }
    template <class F>
    requires std::is_invocable_v<F>
    auto perform(F function)
    {
        using Result = std::invoke_result_t<F>;
        if constexpr (std::is_void_v<Result>) {
            return perform(detail::callAsTask(std::function<void()>(std::move(function))));
        } else {
            return perform(detail::callAsTask(std::move(function)));
        }
    }

protected:
    /// Appends `body`. `awaitedBy` (null for posted work) is the caller's item, which is suspended until
    /// `body` ends; if the queue is idle an implementation may run such a body on the calling thread.
    virtual void start(Task<void> body, WorkItem* awaitedBy, std::shared_ptr<void> connection) = 0;

    /// True for a queue that runs one item at a time.
    virtual bool isSerial() const = 0;

    /// Aborts when this queue is serial and `item`, or an item that waits for it, runs on it.
    void abortIfHeldBy(const WorkItem* item) const
    {
        std::shared_ptr<WorkItem> holder;
        for (; isSerial() && item != nullptr; item = (holder = item->awaiter.lock()).get()) {
            if (&item->queue == this) {
                detail::abortWithMessage("work on \"" + WorkItem::current()->queue.label() +
                                         "\" waits for queue \"" + label() + "\", which it holds");
            }
        }
    }
};

}  // namespace typhon
