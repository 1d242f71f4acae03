// A serial queue is a line of items and a slot for the one that runs. The slot is held until the item has
// ended, so a suspended item keeps the queue but no thread. What can run is always one slice: the coroutine
// handle in ready_. Whoever takes it under the mutex runs it: a pool thread that got the announcement,
// the thread that started awaited work on an idle queue, or a pool thread blocked in sync whose turn lies
// behind it (the pool might have no other thread left to get it there).
//
// Items, and with them frames full of other people's objects, are destroyed with the mutex released.

#include "platform/linux/linux_serial_queue.h"

#include <future>
#include <set>
#include <utility>

namespace typhon {

namespace {

/// So many slices run in one go before other work of the pool gets its turn.
constexpr int slicesAtOnce = 32;

/// Kept for good: there are as many labels as places in the code that make queues.
const std::string& keptLabel(std::string label)
{
    static std::mutex mutex;
    static auto& labels = *new std::set<std::string>;
    const std::lock_guard lock(mutex);
    return *labels.insert(std::move(label)).first;
}

}  // namespace

LinuxSerialQueue::LinuxSerialQueue(std::string label, std::shared_ptr<Executor> executor)
    : label_(keptLabel(std::move(label))), executor_(std::move(executor))
{}

void LinuxSerialQueue::start(Task<void> body, WorkItem* awaitedBy, std::shared_ptr<void> connection)
{
    const auto self = shared_from_this();
    auto item = std::make_shared<LinuxWorkItem>(self, awaitedBy, std::move(connection));
    item->setBody(std::move(body));
    const bool here = mayRunHere(*item, awaitedBy);
    Lock lock(mutex_);
    if (closed_) {
        lock.unlock();
        return;
    }
    if (running_) {
        line().items.push_back(std::move(item));
        return;
    }
    ready_ = item->root();
    running_ = std::move(item);
    if (here && !sliceRuns_) {
        runSlice(lock);
    }
    announceIfReady(lock);
}

bool LinuxSerialQueue::mayRunHere(const LinuxWorkItem& item, const WorkItem* awaitedBy) const
{
    // A message may be handled right where it was read, but not in the middle of somebody else's item,
    // which does not expect foreign code to run inside its calls.
    const bool wanted = awaitedBy != nullptr || (item.connection && WorkItem::current() == nullptr);
    return wanted && executor_->isCurrentThread();
}

void LinuxSerialQueue::sync(const std::function<void()>& work)
{
    WorkItem* caller = WorkItem::current();
    abortIfHeldBy(caller);
    const auto self = shared_from_this();
    const auto item =
        std::make_shared<LinuxWorkItem>(self, caller, caller == nullptr ? nullptr : caller->connection);
    {
        Lock lock(mutex_);
        if (running_) {
            line().items.push_back(item);
            waitForTurn(lock, item);
        } else if (!closed_) {
            running_ = item;
        }
    }
    struct End {
        LinuxWorkItem& item;
        ~End() { item.ended(); }
    };
    const End end{*item};
    item->run(work);
}

void LinuxSerialQueue::waitForTurn(Lock& lock, const std::shared_ptr<LinuxWorkItem>& item)
{
    const bool canHelp = executor_->isCurrentThread();
    auto& waiting = line();
    ++waiting.threads;
    while (running_ != item && !closed_) {
        if (canHelp && ready_ && !sliceRuns_) {
            runSlice(lock);
        } else {
            waiting.turn.wait(lock);
        }
    }
    --waiting.threads;
    dropEmptyLine();
}

/// The caller holds the mutex.
LinuxSerialQueue::Line& LinuxSerialQueue::line()
{
    if (!line_) {
        line_ = std::make_unique<Line>();
    }
    return *line_;
}

/// The caller holds the mutex.
void LinuxSerialQueue::dropEmptyLine()
{
    if (line_ && line_->items.empty() && line_->threads == 0) {
        line_.reset();
    }
}

/// The caller holds the mutex.
void LinuxSerialQueue::wakeWaiting()
{
    if (line_) {
        line_->turn.notify_all();
    }
}

void LinuxSerialQueue::continueItem(const std::shared_ptr<LinuxWorkItem>& item,
                                    std::coroutine_handle<> suspended)
{
    Lock lock(mutex_);
    if (running_ == item) {
        ready_ = suspended;
        announceIfReady(lock);
    }
}

void LinuxSerialQueue::itemEnded(LinuxWorkItem& item)
{
    std::shared_ptr<LinuxWorkItem> finished;
    Lock lock(mutex_);
    if (running_.get() != &item) {
        return;
    }
    finished = std::move(running_);
    running_ = nullptr;
    if (!line_ || line_->items.empty()) {
        lock.unlock();
        return;
    }
    running_ = std::move(line_->items.front());
    line_->items.pop_front();
    dropEmptyLine();
    ready_ = running_->root();
    if (ready_) {
        announceIfReady(lock);
    } else {
        wakeWaiting();
        lock.unlock();
    }
}

void LinuxSerialQueue::close()
{
    Lock lock(mutex_);
    closed_ = true;
    ready_ = nullptr;
    const auto running = std::exchange(running_, nullptr);
    std::list<std::shared_ptr<LinuxWorkItem>> waiting;
    if (line_) {
        waiting.swap(line_->items);
    }
    wakeWaiting();
    lock.unlock();
}

/// Runs the ready slice on this thread. The caller holds the queue, and the mutex, and looks at ready_ after.
void LinuxSerialQueue::runSlice(Lock& lock)
{
    auto item = running_;
    const auto slice = std::exchange(ready_, nullptr);
    sliceRuns_ = true;
    lock.unlock();
    item->run(slice);
    item.reset();
    lock.lock();
    sliceRuns_ = false;
}

void LinuxSerialQueue::runSlices()
{
    Lock lock(mutex_);
    for (int slices = 0; ready_ && !sliceRuns_ && slices < slicesAtOnce; ++slices) {
        runSlice(lock);
    }
    announceIfReady(lock);
}

/// Finds a thread for the ready slice, unless one is about to see it anyway. Releases the mutex.
void LinuxSerialQueue::announceIfReady(Lock& lock)
{
    const bool needed = ready_ && !sliceRuns_;
    if (needed) {
        wakeWaiting();
    }
    lock.unlock();
    if (!needed) {
        return;
    }
    executor_->post(
        [self = std::static_pointer_cast<LinuxSerialQueue>(shared_from_this())] { self->runSlices(); });
}

void LinuxMainQueue::sync(const std::function<void()>& work)
{
    WorkItem* caller = WorkItem::current();
    abortIfHeldBy(caller);
    if (executor().isCurrentThread()) {
        LinuxSerialQueue::sync(work);
        return;
    }
    auto task = std::make_shared<std::packaged_task<void()>>(work);
    auto finished = task->get_future();
    std::function<void()> call = [task] { (*task)(); };
    start(detail::callAsTask(std::move(call)), caller, caller == nullptr ? nullptr : caller->connection);
    task.reset();
    call = nullptr;
    finished.get();
}

}  // namespace typhon
