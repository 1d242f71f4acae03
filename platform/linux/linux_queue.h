#pragma once

#include "platform/root_task.h"
#include "platform/work_queue.h"

#include <coroutine>
#include <memory>
#include <string>
#include <utility>

namespace typhon {

class LinuxWorkItem;

/// What items need of the queue that runs them.
class LinuxQueue : public WorkQueue, public std::enable_shared_from_this<LinuxQueue> {
public:
    /// Runs the next slice of `item`, which begins at `suspended`. Any thread.
    virtual void continueItem(const std::shared_ptr<LinuxWorkItem>& item,
                              std::coroutine_handle<> suspended) = 0;
    /// The item has run its last instruction; called by the item's own code.
    virtual void itemEnded(LinuxWorkItem& item) = 0;
    /// Drops all items, suspended ones included, and takes no more.
    virtual void close() = 0;
};

/// An item holds its queue: a queue that everybody let go of still finishes what it was given.
class LinuxWorkItem final : public WorkItem {
public:
    LinuxWorkItem(std::shared_ptr<LinuxQueue> owner, WorkItem* awaitedBy, std::shared_ptr<void> handledFor)
        : WorkItem(*owner), owner_(std::move(owner))
    {
        connection = std::move(handledFor);
        if (awaitedBy != nullptr) {
            awaiter = awaitedBy->weak_from_this();
        }
    }

    /// Gives the item its coroutine. One without is the turn of a thread that waits in `sync`.
    void setBody(Task<void> body) { root_ = runToEnd(*this, std::move(body)); }
    std::coroutine_handle<> root() const { return root_.handle(); }

    void resume(std::coroutine_handle<> suspended) override
    {
        owner_->continueItem(std::static_pointer_cast<LinuxWorkItem>(shared_from_this()), suspended);
    }
    void ended() { owner_->itemEnded(*this); }

    /// Runs `code` on this thread as this item's.
    template <class Code>
    void run(const Code& code)
    {
        struct Restore {
            WorkItem* previous;
            ~Restore() { current() = previous; }
        };
        const Restore restore{std::exchange(current(), this)};
        code();
    }

private:
    const std::shared_ptr<LinuxQueue> owner_;
    RootTask root_;
};

}  // namespace typhon
