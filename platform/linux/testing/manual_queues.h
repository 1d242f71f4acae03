#pragma once

#include "platform/root_task.h"
#include "platform/work_queues.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace typhon::testing {

/// Remembers what a timer was armed for; fires when the test says so. Work on the queue runs at once.
class ManualQueues final : public WorkQueues {
public:
    class Queue final : public WorkQueue {
    public:
        const std::string& label() const override { return label_; }
        void sync(const std::function<void()>& work) override { work(); }

    protected:
        void start(Task<void> body, WorkItem*, std::shared_ptr<void>) override
        {
            kept_.push_back(run(std::move(body)));
            kept_.back().handle().resume();
        }
        bool isSerial() const override { return true; }

    private:
        static RootTask run(Task<void> body) { co_await std::move(body); }
        std::string label_ = "activities";
        std::vector<RootTask> kept_;
    };
    class ManualTimer final : public Timer {
    public:
        ManualTimer(ManualQueues& owner, std::function<void()> handler) : owner_(owner)
        {
            owner_.fire = std::move(handler);
        }
        void schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds) override
        {
            owner_.armedFor = std::chrono::duration<double>(delay).count();
        }
        void cancel() override {}

    private:
        ManualQueues& owner_;
    };

    std::shared_ptr<WorkQueue> createSerialQueue(std::string) override { return std::make_shared<Queue>(); }
    WorkQueue& concurrentQueue(Priority) override { return queue_; }
    WorkQueue& mainQueue() override { return queue_; }
    std::shared_ptr<Semaphore> createSemaphore(unsigned) override { return nullptr; }
    std::unique_ptr<Timer> createTimer(WorkQueue&, std::function<void()> handler) override
    {
        return std::make_unique<ManualTimer>(*this, std::move(handler));
    }
    Task<void> pause(std::chrono::nanoseconds) override { co_return; }
    void runMainLoop() override {}

    double armedFor = -1;
    std::function<void()> fire;

private:
    Queue queue_;
};

}  // namespace typhon::testing
