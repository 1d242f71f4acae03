#pragma once

#include <atomic>
#include <coroutine>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <variant>

namespace typhon {

class WorkQueue;

/// One piece of work on a queue, from its first instruction to its end, suspensions included. A serial
/// queue runs one item at a time, and a suspended item keeps holding it. Items are owned by their queue;
/// everybody else holds them weakly.
class WorkItem : public std::enable_shared_from_this<WorkItem> {
public:
    explicit WorkItem(WorkQueue& runsOn) : queue(runsOn) {}
    virtual ~WorkItem() = default;
    WorkItem(const WorkItem&) = delete;
    WorkItem& operator=(const WorkItem&) = delete;

    /// The item whose code the calling thread is running, or null outside of any queue. Queues set it
    /// around every slice of an item and restore the previous one afterwards.
    static WorkItem*& current() noexcept
    {
        thread_local WorkItem* item = nullptr;
        return item;
    }

    /// Continues `suspended`, a coroutine of this item, on this item's queue. From any thread; returns
    /// without waiting for it. Called once for each suspension.
    virtual void resume(std::coroutine_handle<> suspended) = 0;

    /// The queue that runs this item.
    WorkQueue& queue;
    /// The item that waits for this one to end, if any. Set before the item starts, constant afterwards.
    std::weak_ptr<WorkItem> awaiter;
    /// The IPC connection whose message or reply this item handles (a `Connection`), or null. Inherited
    /// by the work that this item awaits on other queues, not by what it posts. Constant once started.
    std::shared_ptr<void> connection;
};

namespace detail {

/// Rendezvous between a coroutine that is about to suspend and the callback that completes it.
template <class T>
struct CompletionState {
    enum Phase { starting, suspended, completed };
    using Value = std::conditional_t<std::is_void_v<T>, std::monostate, T>;

    std::atomic<Phase> phase{starting};
    std::atomic<bool> taken{false};
    std::optional<Value> value;
    std::weak_ptr<WorkItem> item;
    std::coroutine_handle<> handle;

    void complete(Value result)
    {
        if (taken.exchange(true)) {
            return;
        }
        value.emplace(std::move(result));
        if (phase.exchange(completed) == suspended) {
            if (auto waiting = item.lock()) {
                waiting->resume(handle);
            }
        }
    }
};

/// Ends the process with `message` on standard error: for mistakes in our own code that would hang.
[[noreturn]] inline void abortWithMessage(const std::string& message)
{
    std::fprintf(stderr, "typhon: %s\n", message.c_str());
    std::abort();
}

}  // namespace detail

/// Awaitable that runs `start(done)` and suspends the running item until `done` is called, with a value
/// unless `T` is void, from any thread. Later calls of `done` are ignored. If `done` is never called the
/// item stays suspended; if the item is gone by then, `done` does nothing. Destroying every copy of `done`
/// does not resume the item.
template <class T>
class AwaitCompletion {
public:
    using State = detail::CompletionState<T>;
    using Done = std::conditional_t<std::is_void_v<T>, std::function<void()>,
                                    std::function<void(typename State::Value)>>;
    using Start = std::function<void(Done)>;

    explicit AwaitCompletion(Start start) : start_(std::move(start)) {}

    bool await_ready() const noexcept { return false; }
    bool await_suspend(std::coroutine_handle<> handle)
    {
        WorkItem* item = WorkItem::current();
        if (item == nullptr) {
            detail::abortWithMessage("a task was awaited outside of any work queue");
        }
        state_->item = item->weak_from_this();
        state_->handle = handle;
        auto state = state_;
        auto start = std::move(start_);
        if constexpr (std::is_void_v<T>) {
            start([state] { state->complete({}); });
        } else {
            start([state](T value) { state->complete(std::move(value)); });
        }
        return state->phase.exchange(State::suspended) != State::completed;
    }
    T await_resume()
    {
        if constexpr (!std::is_void_v<T>) {
            return std::move(*state_->value);
        }
    }

private:
    Start start_;
    std::shared_ptr<State> state_ = std::make_shared<State>();
};

/// `co_await awaitCompletion<T>(start)`: see `AwaitCompletion`.
template <class T = void>
AwaitCompletion<T> awaitCompletion(typename AwaitCompletion<T>::Start start)
{
    return AwaitCompletion<T>{std::move(start)};
}

}  // namespace typhon
