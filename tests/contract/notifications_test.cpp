#include "../../platform/linux/testing/private_bus.h"
#include "../../platform/linux/testing/scratch_folder.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/linux_notifications.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/scratch_directory.h"
#include "platform/linux/system_bus.h"
#include "platform/simulated/simulated_notifications.h"
#include "platform/simulated/simulated_scheduler.h"
#include "platform/simulated/simulated_work_queues.h"

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {
namespace {

/// Announced by a test to find out whether anything arrives yet; counts as no event.
const std::string probe = "probe";

/// The events that reached a handler, and on which queue.
class Received {
public:
    std::function<void(PropertyList)> handler()
    {
        return [this](PropertyList event) {
            const std::lock_guard lock(mutex_);
            if (*event.find(event_streams::eventName)->asString() == probe) {
                ++probes_;
                changed_.notify_all();
                return;
            }
            events_.push_back(std::move(event));
            queues_.push_back(WorkItem::current()->queue.label());
            changed_.notify_all();
        };
    }
    bool waitFor(std::size_t count)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, std::chrono::seconds(60), [&] { return events_.size() >= count; });
    }
    bool waitForProbe(std::chrono::milliseconds patience)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, patience, [&] { return probes_ > 0; });
    }
    std::vector<PropertyList> events() const
    {
        const std::lock_guard lock(mutex_);
        return events_;
    }
    std::vector<std::string> queues() const
    {
        const std::lock_guard lock(mutex_);
        return queues_;
    }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<PropertyList> events_;
    std::vector<std::string> queues_;
    unsigned probes_ = 0;
};

/// One notification service, and the rest of the system.
class Subject {
public:
    virtual ~Subject() = default;
    virtual WorkQueues& queues() = 0;
    virtual Notifications& notifications() = 0;
    virtual void announceNotifyCentre(const std::string& name) = 0;
    /// With the user info {"answer": number}.
    virtual void announceDistributed(const std::string& name, int number) = 0;
    virtual bool waitFor(Received& received, std::size_t count) = 0;
    /// The next name that reached the rest of the system.
    virtual std::string nextPosted() = 0;
};

class SimulatedSubject final : public Subject {
public:
    WorkQueues& queues() override { return queues_; }
    Notifications& notifications() override { return notifications_; }
    void announceNotifyCentre(const std::string& name) override { notifications_.deliverNotifyCentre(name); }
    void announceDistributed(const std::string& name, int number) override
    {
        notifications_.deliverDistributed(name, PropertyList::Dictionary{{"answer", number}});
    }
    bool waitFor(Received& received, std::size_t count) override
    {
        scheduler_.runUntilIdle();
        return received.events().size() >= count;
    }
    std::string nextPosted() override { return notifications_.posted().at(taken_++); }

private:
    SimulatedScheduler scheduler_{1};
    SimulatedWorkQueues queues_{scheduler_};
    SimulatedNotifications notifications_;
    std::size_t taken_ = 0;
};

class LinuxSubject final : public Subject {
public:
    LinuxSubject()
    {
        services_.own("com.vorlan.pingd");
        services_.own("com.vorlan.relayd");
        notifications_.start();
        waitUntilSubscribed(event_streams::notifyCentre, [this] { announceNotifyCentre(probe); });
        waitUntilSubscribed(event_streams::distributed, [this] { announceDistributed(probe, 0); });
    }
    ~LinuxSubject() override { pool_.stop(); }

    WorkQueues& queues() override { return queues_; }
    Notifications& notifications() override { return notifications_; }
    void announceNotifyCentre(const std::string& name) override
    {
        services_.emit("/com/vorlan/pingd", "com.vorlan.pingd", "s", name.c_str());
    }
    void announceDistributed(const std::string& name, int number) override
    {
        services_.emit("/com/vorlan/relayd", "com.vorlan.relayd", "sa{sv}", name.c_str(), 1, "answer", "x",
                       std::int64_t{number});
    }
    bool waitFor(Received& received, std::size_t count) override { return received.waitFor(count); }
    std::string nextPosted() override
    {
        for (auto message = services_.next(); message; message = services_.next()) {
            const char* name = nullptr;
            if (sd_bus_message_is_method_call(message.get(), "com.vorlan.pingd", "Post") > 0 &&
                sd_bus_message_read(message.get(), "s", &name) >= 0) {
                return name;
            }
        }
        return "nothing was posted";
    }

private:
    /// Nobody can tell from outside when the bus sends signals to the service under test: announces until one
    /// has arrived.
    void waitUntilSubscribed(const std::string& stream, const std::function<void()>& announce)
    {
        Received probes;
        notifications_.setEventStreamHandler(stream, queue_, probes.handler());
        unsigned attempts = 0;
        do {
            announce();
        } while (!probes.waitForProbe(std::chrono::milliseconds(20)) && ++attempts < 3000);
        EXPECT_LT(attempts, 3000u);
        notifications_.setEventStreamHandler(stream, queue_, [](const PropertyList&) {});
        queue_->sync([] {});
    }

    ScratchDirectory scratch_;
    RootDirectory root_{scratch_.path()};
    typhon::testing::PrivateBus bus_{root_.real(systemBusSocket)};
    typhon::testing::BusPeer services_{root_.real(systemBusSocket)};
    typhon::testing::RecordingLog log_;
    EventPool pool_;
    LinuxWorkQueues queues_{pool_};
    const std::shared_ptr<WorkQueue> queue_ = queues_.createSerialQueue("probe");
    LinuxNotifications notifications_{pool_, queues_, log_, root_};
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class NotificationsContract : public ::testing::TestWithParam<Implementation> {
protected:
    ~NotificationsContract() override { subject.reset(); }
    void handle(const char* stream, Received& received)
    {
        subject->notifications().setEventStreamHandler(stream, queue, received.handler());
    }

    Received first;
    Received second;
    std::unique_ptr<Subject> subject = GetParam().make();
    std::shared_ptr<WorkQueue> queue = subject->queues().createSerialQueue("the handler's queue");
};

PropertyList notifyCentreEvent(const std::string& name)
{
    return PropertyList::Dictionary{{"EventName", name}};
}

PropertyList distributedEvent(const std::string& name, int number)
{
    return PropertyList::Dictionary{{"EventName", name},
                                    {"UserInfo", PropertyList::Dictionary{{"answer", number}}}};
}

TEST_P(NotificationsContract, ANotifyCentreNotificationArrivesWithItsName)
{
    handle(event_streams::notifyCentre, first);
    subject->announceNotifyCentre("com.vorlan.example");
    ASSERT_TRUE(subject->waitFor(first, 1));
    EXPECT_EQ(first.events().front(), notifyCentreEvent("com.vorlan.example"));
}

TEST_P(NotificationsContract, ADistributedNotificationArrivesWithItsUserInfo)
{
    handle(event_streams::distributed, first);
    subject->announceDistributed("com.vorlan.example", 42);
    ASSERT_TRUE(subject->waitFor(first, 1));
    EXPECT_EQ(first.events().front(), distributedEvent("com.vorlan.example", 42));
}

TEST_P(NotificationsContract, EachStreamHasItsOwnEvents)
{
    handle(event_streams::notifyCentre, first);
    handle(event_streams::distributed, second);
    subject->announceNotifyCentre("one");
    subject->announceDistributed("two", 2);
    ASSERT_TRUE(subject->waitFor(first, 1));
    ASSERT_TRUE(subject->waitFor(second, 1));
    EXPECT_EQ(first.events(), std::vector{notifyCentreEvent("one")});
    EXPECT_EQ(second.events(), std::vector{distributedEvent("two", 2)});
}

TEST_P(NotificationsContract, EventsArriveInTheOrderInWhichTheyWereAnnounced)
{
    handle(event_streams::distributed, first);
    for (int number = 0; number < 50; ++number) {
        subject->announceDistributed("count", number);
    }
    ASSERT_TRUE(subject->waitFor(first, 50));
    for (int number = 0; number < 50; ++number) {
        EXPECT_EQ(first.events().at(static_cast<std::size_t>(number)), distributedEvent("count", number));
    }
}

TEST_P(NotificationsContract, TheHandlerRunsOnItsQueue)
{
    handle(event_streams::notifyCentre, first);
    subject->announceNotifyCentre("one");
    ASSERT_TRUE(subject->waitFor(first, 1));
    EXPECT_EQ(first.queues(), std::vector<std::string>{"the handler's queue"});
}

TEST_P(NotificationsContract, ASecondHandlerTakesThePlaceOfTheFirst)
{
    handle(event_streams::notifyCentre, first);
    handle(event_streams::notifyCentre, second);
    subject->announceNotifyCentre("one");
    ASSERT_TRUE(subject->waitFor(second, 1));
    EXPECT_TRUE(first.events().empty());
}

TEST_P(NotificationsContract, WhatIsPostedReachesTheSystemInOrder)
{
    subject->notifications().postNotifyCentreNotification("one");
    subject->notifications().postNotifyCentreNotification("two");
    EXPECT_EQ(subject->nextPosted(), "one");
    EXPECT_EQ(subject->nextPosted(), "two");
}

INSTANTIATE_TEST_SUITE_P(
    Implementations, NotificationsContract,
    ::testing::Values(Implementation{"Simulated", [] { return std::make_unique<SimulatedSubject>(); }},
                      Implementation{"Linux", [] { return std::make_unique<LinuxSubject>(); }}),
    [](const auto& tested) { return tested.param.name; });

}  // namespace
}  // namespace typhon
