#include "platform/linux/linux_notifications.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/subscribed_notifications.h"
#include "platform/linux/system_bus.h"
#include "testing/private_bus.h"
#include "testing/scratch_folder.h"

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <filesystem>
#include <mutex>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::BusPeer;
using testing::PrivateBus;

/// A service of typhon on a bus, which trusts users as the test says.
class LinuxNotificationsTest : public ::testing::Test {
protected:
    ~LinuxNotificationsTest() override { pool.stop(); }

    void start(const TrustsUser& trusts)
    {
        notifications = std::make_unique<LinuxNotifications>(pool, queues, log, folder.root, trusts);
        notifications->setEventStreamHandler(event_streams::notifyCentre, queues.createSerialQueue("handler"),
                                             [this](const PropertyList& event) {
                                                 const std::lock_guard lock(mutex);
                                                 names.push_back(
                                                     *event.find(event_streams::eventName)->asString());
                                                 changed.notify_all();
                                             });
        notifications->start();
    }
    bool waitForName(const std::string& name)
    {
        std::unique_lock lock(mutex);
        return changed.wait_for(lock, std::chrono::seconds(60),
                                [&] { return std::find(names.begin(), names.end(), name) != names.end(); });
    }

    bool waitUntilHeard(BusPeer& owner)
    {
        for (int attempt = 0; attempt < 3000; ++attempt) {
            owner.emit(path, service, "s", "probe");
            std::unique_lock lock(mutex);
            if (changed.wait_for(lock, std::chrono::milliseconds(20), [this] { return !names.empty(); })) {
                return true;
            }
        }
        return false;
    }
    std::vector<std::string> soundNames()
    {
        const std::lock_guard lock(mutex);
        auto sound = names;
        std::erase(sound, "probe");
        return sound;
    }

    static constexpr const char* service = "com.vorlan.pingd";
    static constexpr const char* path = "/com/vorlan/pingd";

    testing::ScratchFolder folder;
    const std::string socket = folder.root.real(systemBusSocket);
    testing::RecordingLog log;
    std::mutex mutex;
    std::condition_variable changed;
    std::vector<std::string> names;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    std::unique_ptr<LinuxNotifications> notifications;
};

TEST_F(LinuxNotificationsTest, OnlySubscribedNotificationsArriveWhereTheRegistrationSaysWhich)
{
    folder.write(subscriptionsFile, "<plist version=\"1.0\"><dict><key>com.vorlan.pingd.matching</key><array>"
                                    "<string>probe</string><string>wanted</string><integer>1</integer>"
                                    "</array></dict></plist>");
    const PrivateBus bus(socket);
    start([](uid_t) { return true; });
    BusPeer owner(socket);
    owner.own(service);
    ASSERT_TRUE(waitUntilHeard(owner));
    owner.emit(path, service, "s", "unwanted");
    owner.emit(path, service, "s", "wanted");
    EXPECT_TRUE(waitForName("wanted"));
    EXPECT_EQ(soundNames(), std::vector<std::string>{"wanted"});
}

TEST_F(LinuxNotificationsTest, WithoutASoundRegistrationEveryNotificationIsSubscribed)
{
    EXPECT_EQ(subscribedNotifications(folder.root, "a"), std::nullopt);
    for (const std::string contents : {"no property list", "<plist version=\"1.0\"><array/></plist>",
                                       "<plist version=\"1.0\"><dict><key>a</key><true/></dict></plist>"}) {
        folder.write(subscriptionsFile, contents);
        EXPECT_EQ(subscribedNotifications(folder.root, "a"), std::nullopt) << contents;
    }
}

TEST_F(LinuxNotificationsTest, EventsOfAnOwnerThatRunsAsTheWrongUserAreIgnored)
{
    const PrivateBus bus(socket);
    BusPeer wrong(socket);
    BusPeer right(socket);
    wrong.own(service);
    std::atomic<int> decisions = 0;
    start([&decisions](uid_t) { return ++decisions > 1; });
    wrong.roundTrip();
    while (decisions == 0) {
        wrong.emit(path, service, "s", "of the wrong one");
    }
    wrong.emit(path, service, "s", "of the wrong one");
    wrong.release(service);
    right.own(service);
    EXPECT_TRUE(waitUntilHeard(right));
    right.emit(path, service, "s", "of the right one");
    EXPECT_TRUE(waitForName("of the right one"));
    EXPECT_EQ(soundNames(), std::vector<std::string>{"of the right one"});
}

TEST_F(LinuxNotificationsTest, EventsThatComeWhileTheOwnerIsBeingCheckedAreNotLost)
{
    const PrivateBus bus(socket);
    BusPeer first(socket);
    first.own(service);
    start(isRootOrOwnUser);
    ASSERT_TRUE(waitUntilHeard(first));
    first.release(service);
    for (int round = 0; round < 20; ++round) {
        BusPeer next(socket);
        next.own(service);
        const auto name = "round " + std::to_string(round);
        next.emit(path, service, "s", name.c_str());
        EXPECT_TRUE(waitForName(name));
    }
}

TEST_F(LinuxNotificationsTest, WhatIsPostedWithoutABusIsDropped)
{
    start(isRootOrOwnUser);
    notifications->postNotifyCentreNotification("dropped");
    // Its absence is logged after what was posted had its turn.
    while (!log.has("no system bus at")) {
        queues.createSerialQueue("pause")->sync([] {});
    }
    const PrivateBus bus(socket);
    BusPeer owner(socket);
    owner.own(service);
    ASSERT_TRUE(waitUntilHeard(owner));
    notifications->postNotifyCentreNotification("taken");
    auto message = owner.next();
    while (message && sd_bus_message_is_method_call(message.get(), service, "Post") <= 0) {
        message = owner.next();
    }
    const char* name = "";
    ASSERT_TRUE(message);
    sd_bus_message_read(message.get(), "s", &name);
    EXPECT_STREQ(name, "taken");
}

TEST_F(LinuxNotificationsTest, ASocketThatNeverAnswersStopsNothing)
{
    std::filesystem::create_directories(folder.root.real("/run/dbus"));
    auto silent = listenAt(folder.root.real("/run/dbus"), "system_bus_socket");
    ASSERT_TRUE(silent.socket) << silent.problem;
    start(isRootOrOwnUser);
    notifications->postNotifyCentreNotification("into the void");
    notifications.reset();
    queues.createSerialQueue("still works")->sync([] {});
}

TEST_F(LinuxNotificationsTest, AStreamThatDoesNotExistIsNamedInTheLog)
{
    start(isRootOrOwnUser);
    notifications->setEventStreamHandler("com.vorlan.nowhere", queues.createSerialQueue("handler"),
                                         [](const PropertyList&) {});
    EXPECT_TRUE(log.has("there is no event stream \"com.vorlan.nowhere\""));
}

}  // namespace
}  // namespace typhon
