#include "platform/linux/linux_concurrent_queue.h"

#include <utility>

namespace typhon {

LinuxConcurrentQueue::LinuxConcurrentQueue(std::string label, std::shared_ptr<Executor> executor)
    : label_(std::move(label)), executor_(std::move(executor))
{}

void LinuxConcurrentQueue::start(Task<void> body, WorkItem* awaitedBy, std::shared_ptr<void> connection)
{
    auto item = std::make_shared<LinuxWorkItem>(shared_from_this(), awaitedBy, std::move(connection));
    item->setBody(std::move(body));
    {
        const std::lock_guard lock(mutex_);
        if (closed_) {
            return;
        }
        items_.insert(item);
    }
    continueItem(item, item->root());
}

void LinuxConcurrentQueue::sync(const std::function<void()>& work)
{
    WorkItem* caller = WorkItem::current();
    const auto item = std::make_shared<LinuxWorkItem>(shared_from_this(), caller,
                                                      caller == nullptr ? nullptr : caller->connection);
    item->run(work);
}

void LinuxConcurrentQueue::continueItem(const std::shared_ptr<LinuxWorkItem>& item,
                                        std::coroutine_handle<> suspended)
{
    executor_->post([waiting = std::weak_ptr(item), suspended] {
        if (const auto running = waiting.lock()) {
            running->run(suspended);
        }
    });
}

void LinuxConcurrentQueue::itemEnded(LinuxWorkItem& item)
{
    const auto finished = std::static_pointer_cast<LinuxWorkItem>(item.shared_from_this());
    const std::lock_guard lock(mutex_);
    items_.erase(finished);
}

void LinuxConcurrentQueue::close()
{
    std::unordered_set<std::shared_ptr<LinuxWorkItem>> dropped;
    const std::lock_guard lock(mutex_);
    closed_ = true;
    dropped.swap(items_);
}

}  // namespace typhon
