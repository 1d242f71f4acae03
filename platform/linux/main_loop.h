#pragma once

#include "platform/linux/executor.h"

#include <atomic>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <thread>

namespace typhon {

/// The jobs of the main thread. Those posted before `run` are kept for it.
class MainLoop final : public Executor {
public:
    void post(Job job) override;
    bool isCurrentThread() const override;

    /// Makes the calling thread the main thread and runs jobs on it until `stop`.
    void run();
    /// Lets `run` return after the job that runs at present. Any thread.
    void stop();
    void drop();

private:
    std::atomic<std::thread::id> thread_{};
    std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable changed_;
    std::deque<Job> jobs_;
    bool stopping_ = false;
};

}  // namespace typhon
