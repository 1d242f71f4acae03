#pragma once

#include "platform/root_task.h"
#include "platform/simulated/simulated_scheduler.h"
#include "platform/work_queue.h"

#include <cstddef>
#include <deque>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace typhon {

class SimulatedQueue;

/// An item holds its queue: a queue that everybody let go of still finishes what it was given.
class SimulatedItem final : public WorkItem {
public:
    SimulatedItem(std::shared_ptr<SimulatedQueue> owner, WorkItem* awaitedBy,
                  std::shared_ptr<void> handledFor);

    /// Gives the item its coroutine. One without is the turn of a caller of `sync`.
    void setBody(Task<void> body) { root_ = runToEnd(*this, std::move(body)); }
    std::coroutine_handle<> root() const { return root_.handle(); }
    void resume(std::coroutine_handle<> suspended) override;
    void ended();
    /// Runs `code` as this item's.
    void run(const std::function<void()>& code);

private:
    const std::shared_ptr<SimulatedQueue> owner_;
    RootTask root_;
};

/// A queue of the simulation, serial or concurrent. Awaited work, and the handling of a message, begins at
/// once on an idle queue or waits for the scheduler, as the seed decides.
class SimulatedQueue final : public WorkQueue, public std::enable_shared_from_this<SimulatedQueue> {
public:
    SimulatedQueue(SimulatedScheduler& scheduler, std::string label, bool serial)
        : scheduler_(scheduler), label_(std::move(label)), serial_(serial)
    {}

    const std::string& label() const override { return label_; }
    /// Runs other work meanwhile, until it is the caller's turn; aborts if that can never be.
    void sync(const std::function<void()>& work) override;
    /// Drops all items, suspended ones included, and takes no more.
    void close();
    /// Items that wait, run or are suspended.
    std::size_t itemCount() const { return running_.size() + waiting_.size(); }

private:
    friend class SimulatedItem;

    void start(Task<void> body, WorkItem* awaitedBy, std::shared_ptr<void> connection) override;
    bool isSerial() const override { return serial_; }
    void waitForTurn(const SimulatedItem& item);
    void admitNext();
    void makeReady(const std::shared_ptr<SimulatedItem>& item, std::coroutine_handle<> slice);
    void itemEnded(SimulatedItem& item);

    SimulatedScheduler& scheduler_;
    const std::string label_;
    const bool serial_;
    bool closed_ = false;
    /// The items that have begun: at most one on a serial queue.
    std::vector<std::shared_ptr<SimulatedItem>> running_;
    std::deque<std::shared_ptr<SimulatedItem>> waiting_;
};

}  // namespace typhon
