#pragma once

#include "platform/linux/executor.h"
#include "platform/linux/linux_queue.h"

#include <memory>
#include <mutex>
#include <string>
#include <unordered_set>

namespace typhon {

/// A concurrent queue: every slice is a job of its own for the executor.
class LinuxConcurrentQueue final : public LinuxQueue {
public:
    LinuxConcurrentQueue(std::string label, std::shared_ptr<Executor> executor);

    const std::string& label() const override { return label_; }
    void sync(const std::function<void()>& work) override;
    void continueItem(const std::shared_ptr<LinuxWorkItem>& item, std::coroutine_handle<> suspended) override;
    void itemEnded(LinuxWorkItem& item) override;
    void close() override;

private:
    void start(Task<void> body, WorkItem* awaitedBy, std::shared_ptr<void> connection) override;
    bool isSerial() const override { return false; }

    const std::string label_;
    const std::shared_ptr<Executor> executor_;

    std::mutex mutex_;
    // Protected by mutex_.
    std::unordered_set<std::shared_ptr<LinuxWorkItem>> items_;
    bool closed_ = false;
};

}  // namespace typhon
