#pragma once

#include "platform/task.h"
#include "platform/work_queue.h"

#include <coroutine>
#include <exception>
#include <string>
#include <utility>

namespace typhon {

/// The outermost coroutine of a work item; for implementations of `WorkQueue` only. It starts when its
/// handle is first resumed and stays at its end until it is destroyed, together with all that hangs on it.
class RootTask {
public:
    struct promise_type {
        RootTask get_return_object() noexcept
        {
            return RootTask{std::coroutine_handle<promise_type>::from_promise(*this)};
        }
        std::suspend_always initial_suspend() const noexcept { return {}; }
        std::suspend_always final_suspend() const noexcept { return {}; }
        void return_void() const noexcept {}
        void unhandled_exception() const noexcept { std::terminate(); }
    };

    RootTask() = default;
    explicit RootTask(std::coroutine_handle<> handle) noexcept : handle_(handle) {}
    RootTask(RootTask&& other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}
    RootTask& operator=(RootTask&& other) noexcept
    {
        std::swap(handle_, other.handle_);
        return *this;
    }
    RootTask(const RootTask&) = delete;
    RootTask& operator=(const RootTask&) = delete;
    ~RootTask()
    {
        if (handle_) {
            handle_.destroy();
        }
    }

    std::coroutine_handle<> handle() const noexcept { return handle_; }

private:
    std::coroutine_handle<> handle_;
};

/// Ends the process because `failure` left work on the queue `label`.
[[noreturn]] inline void abortBecauseOf(std::exception_ptr failure, const std::string& label)
{
    std::string reason = "an unknown exception";
    try {
        std::rethrow_exception(std::move(failure));
    } catch (const std::exception& error) {
        reason = error.what();
    } catch (...) {
    }
    detail::abortWithMessage("work on \"" + label + "\" failed: " + reason);
}

/// Runs `work` to its end, lets go of it, and then calls `item.ended()`. The item outlives its root task.
template <class Item>
RootTask runToEnd(Item& item, Task<void> work)
{
    try {
        Task<void> running = std::move(work);
        // NOLINTNEXTLINE(bugprone-use-after-move): the check takes the coroutine's frame for a second use.
        co_await std::move(running);
    } catch (...) {
        abortBecauseOf(std::current_exception(), item.queue.label());
    }
    item.ended();
}

}  // namespace typhon
