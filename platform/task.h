#pragma once

#include <atomic>
#include <coroutine>
#include <exception>
#include <optional>
#include <utility>

namespace typhon {

template <class T = void>
class Task;

namespace detail {

/// Hands control back to whoever awaited the finished task, if the awaiter has really gone to sleep.
struct ContinueAwaiter {
    bool await_ready() const noexcept { return false; }
    template <class Promise>
    void await_suspend(std::coroutine_handle<Promise> finished) const noexcept
    {
        if (finished.promise().met.exchange(true)) {
            finished.promise().continuation.resume();
        }
    }
    void await_resume() const noexcept {}
};

struct TaskPromiseBase {
    std::coroutine_handle<> continuation;
    std::exception_ptr exception;
    /// Set by the first to arrive of the task's end and its awaiter's suspension; the second one continues
    /// the awaiter. Transferring control between coroutines instead would need tail calls, which the
    /// compiler makes at -O2 only: elsewhere a loop of tasks that never suspend would eat the stack.
    std::atomic<bool> met{false};

    std::suspend_always initial_suspend() const noexcept { return {}; }
    ContinueAwaiter final_suspend() const noexcept { return {}; }
    void unhandled_exception() noexcept { exception = std::current_exception(); }
};

template <class T>
struct TaskPromise : TaskPromiseBase {
    std::optional<T> value;

    Task<T> get_return_object() noexcept;
    template <class U>
    void return_value(U&& result)
    {
        value.emplace(std::forward<U>(result));
    }
    T take()
    {
        if (exception) {
            std::rethrow_exception(exception);
        }
        return std::move(*value);
    }
};

template <>
struct TaskPromise<void> : TaskPromiseBase {
    Task<void> get_return_object() noexcept;
    void return_void() const noexcept {}
    void take() const
    {
        if (exception) {
            std::rethrow_exception(exception);
        }
    }
};

}  // namespace detail

/// A piece of work that may suspend. It does nothing until it is awaited or given to a work queue, and it
/// can be awaited once. Destroying a task that has not finished destroys its frame with everything in it.
/// An exception that leaves the body is rethrown to the awaiter.
template <class T>
class Task {
public:
    using promise_type = detail::TaskPromise<T>;
    using value_type = T;

    explicit Task(std::coroutine_handle<promise_type> handle) noexcept : handle_(handle) {}
    Task(Task&& other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}
    Task& operator=(Task&& other) noexcept
    {
        std::swap(handle_, other.handle_);
        return *this;
    }
    Task(const Task&) = delete;
    Task& operator=(const Task&) = delete;
    ~Task()
    {
        if (handle_) {
            handle_.destroy();
        }
    }

    auto operator co_await() && noexcept
    {
        struct Awaiter {
            std::coroutine_handle<promise_type> handle;
            bool await_ready() const noexcept { return false; }
            bool await_suspend(std::coroutine_handle<> awaiting) const
            {
                detail::TaskPromiseBase& promise = handle.promise();
                promise.continuation = awaiting;
                handle.resume();
                return !promise.met.exchange(true);
            }
            T await_resume() const { return handle.promise().take(); }
        };
        return Awaiter{handle_};
    }

private:
    std::coroutine_handle<promise_type> handle_;
};

namespace detail {

template <class T>
Task<T> TaskPromise<T>::get_return_object() noexcept
{
    return Task<T>{std::coroutine_handle<TaskPromise<T>>::from_promise(*this)};
}

inline Task<void> TaskPromise<void>::get_return_object() noexcept
{
    return Task<void>{std::coroutine_handle<TaskPromise<void>>::from_promise(*this)};
}

template <class T>
inline constexpr bool isTask = false;
template <class T>
inline constexpr bool isTask<Task<T>> = true;

}  // namespace detail

}  // namespace typhon
