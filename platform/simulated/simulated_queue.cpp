#include "platform/simulated/simulated_queue.h"

#include <algorithm>

namespace typhon {

SimulatedItem::SimulatedItem(std::shared_ptr<SimulatedQueue> owner, WorkItem* awaitedBy,
                             std::shared_ptr<void> handledFor)
    : WorkItem(*owner), owner_(std::move(owner))
{
    connection = std::move(handledFor);
    if (awaitedBy != nullptr) {
        awaiter = awaitedBy->weak_from_this();
    }
}

void SimulatedItem::resume(std::coroutine_handle<> suspended)
{
    owner_->makeReady(std::static_pointer_cast<SimulatedItem>(shared_from_this()), suspended);
}

void SimulatedItem::ended()
{
    owner_->itemEnded(*this);
}

void SimulatedItem::run(const std::function<void()>& code)
{
    struct Restore {
        WorkItem* previous;
        ~Restore() { current() = previous; }
    };
    const Restore restore{std::exchange(current(), this)};
    code();
}

void SimulatedQueue::start(Task<void> body, WorkItem* awaitedBy, std::shared_ptr<void> connection)
{
    const auto item = std::make_shared<SimulatedItem>(shared_from_this(), awaitedBy, std::move(connection));
    item->setBody(std::move(body));
    if (closed_) {
        return;
    }
    const bool idle = !serial_ || (running_.empty() && waiting_.empty());
    const bool mayRunHere = awaitedBy != nullptr || (item->connection && WorkItem::current() == nullptr);
    if (idle && mayRunHere && scheduler_.flipCoin()) {
        running_.push_back(item);
        item->run([&item] { item->root().resume(); });
        return;
    }
    waiting_.push_back(item);
    admitNext();
}

void SimulatedQueue::sync(const std::function<void()>& work)
{
    WorkItem* caller = WorkItem::current();
    abortIfHeldBy(caller);
    const auto item = std::make_shared<SimulatedItem>(shared_from_this(), caller,
                                                      caller == nullptr ? nullptr : caller->connection);
    if (!closed_) {
        waiting_.push_back(item);
        admitNext();
        waitForTurn(*item);
    }
    struct End {
        SimulatedItem& item;
        ~End() { item.ended(); }
    };
    const End end{*item};
    item->run(work);
}

void SimulatedQueue::waitForTurn(const SimulatedItem& item)
{
    const auto isTurn = [this, &item] {
        return closed_ || std::any_of(running_.begin(), running_.end(),
                                      [&item](const auto& other) { return other.get() == &item; });
    };
    // What runs meanwhile runs on other threads, as it were. What is ahead on this queue comes first: other
    // work, begun in here, might wait for something that the caller holds and cannot let go of until then.
    WorkItem* const caller = std::exchange(WorkItem::current(), nullptr);
    while (!isTurn()) {
        if (!scheduler_.stepLane(this) && !scheduler_.stepThroughTime()) {
            detail::abortWithMessage("nothing is left to run, but queue \"" + label_ +
                                     "\" is held by suspended work and waited for");
        }
    }
    WorkItem::current() = caller;
}

/// Lets the longest waiting item begin, if the queue is free.
void SimulatedQueue::admitNext()
{
    while (!waiting_.empty() && (!serial_ || running_.empty())) {
        const auto item = std::move(waiting_.front());
        waiting_.pop_front();
        running_.push_back(item);
        if (item->root()) {
            makeReady(item, item->root());
        }
    }
}

void SimulatedQueue::makeReady(const std::shared_ptr<SimulatedItem>& item, std::coroutine_handle<> slice)
{
    // Weak, so that the frames of dropped items go when they are dropped, not with the scheduler.
    scheduler_.post(serial_ ? static_cast<const void*>(this) : item.get(),
                    [waiting = std::weak_ptr(item), slice] {
                        if (const auto running = waiting.lock()) {
                            running->run([slice] { slice.resume(); });
                        }
                    });
}

void SimulatedQueue::itemEnded(SimulatedItem& item)
{
    const auto self = shared_from_this();
    const auto place = std::find_if(running_.begin(), running_.end(),
                                    [&item](const auto& other) { return other.get() == &item; });
    if (place == running_.end()) {
        return;
    }
    const auto finished = std::move(*place);
    running_.erase(place);
    admitNext();
}

void SimulatedQueue::close()
{
    closed_ = true;
    const auto running = std::exchange(running_, {});
    const auto waiting = std::exchange(waiting_, {});
}

}  // namespace typhon
