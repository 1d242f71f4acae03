#pragma once

#include "platform/linux/executor.h"
#include "platform/linux/linux_queue.h"

#include <condition_variable>
#include <list>
#include <memory>
#include <mutex>
#include <string>

namespace typhon {

/// A serial queue whose slices run on an executor's threads, and in `sync` on the caller's.
class LinuxSerialQueue : public LinuxQueue {
public:
    LinuxSerialQueue(std::string label, std::shared_ptr<Executor> executor);

    const std::string& label() const final { return label_; }
    void sync(const std::function<void()>& work) override;
    void continueItem(const std::shared_ptr<LinuxWorkItem>& item, std::coroutine_handle<> suspended) final;
    void itemEnded(LinuxWorkItem& item) final;
    void close() final;

protected:
    void start(Task<void> body, WorkItem* awaitedBy, std::shared_ptr<void> connection) final;
    bool isSerial() const final { return true; }
    const Executor& executor() const { return *executor_; }

private:
    using Lock = std::unique_lock<std::mutex>;
    /// What waits for its turn.
    struct Line {
        std::list<std::shared_ptr<LinuxWorkItem>> items;
        /// Whose items are in the line, or were just now.
        unsigned threads = 0;
        std::condition_variable turn;
    };

    Line& line();
    void dropEmptyLine();
    bool mayRunHere(const LinuxWorkItem& item, const WorkItem* awaitedBy) const;
    void waitForTurn(Lock& lock, const std::shared_ptr<LinuxWorkItem>& item);
    void runSlice(Lock& lock);
    void runSlices();
    void announceIfReady(Lock& lock);
    void wakeWaiting();

    /// One text for all queues of the same name: every connection has one.
    const std::string& label_;
    const std::shared_ptr<Executor> executor_;

    std::mutex mutex_;
    // All below is protected by mutex_.
    std::shared_ptr<LinuxWorkItem> running_;
    /// Null while nothing waits: most queues belong to idle connections.
    std::unique_ptr<Line> line_;
    /// Where the running item goes on, once some thread takes it.
    std::coroutine_handle<> ready_;
    /// A thread runs a slice, and looks at ready_ when it has returned.
    bool sliceRuns_ = false;
    bool closed_ = false;
};

/// The serial queue of the main thread: `sync` from elsewhere runs the work there too.
class LinuxMainQueue final : public LinuxSerialQueue {
public:
    using LinuxSerialQueue::LinuxSerialQueue;
    void sync(const std::function<void()>& work) override;
};

}  // namespace typhon
