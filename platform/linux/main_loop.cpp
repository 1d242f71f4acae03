#include "platform/linux/main_loop.h"

#include <utility>

namespace typhon {

void MainLoop::post(Job job)
{
    const std::lock_guard lock(mutex_);
    jobs_.push_back(std::move(job));
    changed_.notify_one();
}

bool MainLoop::isCurrentThread() const
{
    return thread_ == std::this_thread::get_id();
}

void MainLoop::run()
{
    thread_ = std::this_thread::get_id();
    std::unique_lock lock(mutex_);
    for (;;) {
        changed_.wait(lock, [this] { return stopping_ || !jobs_.empty(); });
        if (std::exchange(stopping_, false)) {
            break;
        }
        Job job = std::move(jobs_.front());
        jobs_.pop_front();
        lock.unlock();
        job();
        job = nullptr;
        lock.lock();
    }
    thread_ = std::thread::id();
}

void MainLoop::stop()
{
    const std::lock_guard lock(mutex_);
    stopping_ = true;
    changed_.notify_one();
}

void MainLoop::drop()
{
    std::deque<Job> dropped;
    const std::lock_guard lock(mutex_);
    dropped.swap(jobs_);
}

}  // namespace typhon
