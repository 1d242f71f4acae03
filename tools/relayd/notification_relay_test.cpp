#include "../../platform/linux/testing/private_bus.h"
#include "../../platform/linux/testing/scratch_folder.h"
#include "platform/linux/linux_work_queues.h"
#include "tools/relayd/notification_relay.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::BusPeer;
using testing::PrivateBus;

class NotificationRelayTest : public ::testing::Test {
protected:
    ~NotificationRelayTest() override { pool.stop(); }

    void start(const TrustsUser& mayPost, double postsASecond = 1000)
    {
        relay = std::make_shared<NotificationRelay>(mayPost, log, postsASecond);
        connection = std::make_shared<SystemBus>(pool, queues, log, socket);
        connection->start(relay);
        ASSERT_TRUE(poster.waitForOwner(pingService.name));
        ASSERT_TRUE(poster.waitForOwner(relayService.name));
    }
    /// The name of the D-Bus error that answers a post, or an empty text.
    std::string post(const std::string& name)
    {
        sd_bus_error error = SD_BUS_ERROR_NULL;
        sd_bus_call_method(poster.bus(), pingService.name, pingService.path, pingService.name, postMethod,
                           &error, nullptr, "s", name.c_str());
        std::string text = error.name == nullptr ? "" : error.name;
        sd_bus_error_free(&error);
        return text;
    }

    testing::ScratchFolder folder;
    const std::string socket = folder.root.real(systemBusSocket);
    const PrivateBus bus{socket};
    BusPeer poster{socket};
    testing::RecordingLog log;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    std::shared_ptr<NotificationRelay> relay;
    std::shared_ptr<SystemBus> connection;
};

TEST_F(NotificationRelayTest, PostsOfOtherUsersAreRefused)
{
    start([](uid_t) { return false; });
    EXPECT_EQ(post("com.vorlan.example"), ipc_errors::accessDenied);
    EXPECT_TRUE(log.has("refused a notification that was posted to com.vorlan.pingd by user " +
                        std::to_string(::geteuid())));
}

TEST_F(NotificationRelayTest, PostsOfTrustedUsersAreTaken)
{
    start([](uid_t user) { return user == ::geteuid(); });
    EXPECT_EQ(post("com.vorlan.example"), "");
}

TEST_F(NotificationRelayTest, RefusalsDoNotFloodTheLog)
{
    start([](uid_t) { return false; });
    for (int number = 0; number < 200; ++number) {
        post("com.vorlan.example");
    }
    EXPECT_LT(log.lines().size(), 100u);
}

TEST_F(NotificationRelayTest, TooManyPostsInOneSecondAreRefused)
{
    start(isRootOrOwnUser, 1);
    EXPECT_EQ(post("com.vorlan.example"), "");
    // However slow this goes, one of many comes within a second of the one before.
    int refused = 0;
    for (int number = 0; number < 1000 && refused == 0; ++number) {
        refused += post("com.vorlan.example") == ipc_errors::limitsExceeded ? 1 : 0;
    }
    EXPECT_EQ(refused, 1);
}

TEST_F(NotificationRelayTest, ANameThatIsTakenIsWaitedFor)
{
    poster.own(pingService.name);
    relay = std::make_shared<NotificationRelay>(isRootOrOwnUser, log);
    connection = std::make_shared<SystemBus>(pool, queues, log, socket);
    connection->start(relay);
    ASSERT_TRUE(poster.waitForOwner(relayService.name));
    poster.release(pingService.name);
    ASSERT_TRUE(poster.waitForOwner(pingService.name));
    EXPECT_EQ(post("com.vorlan.example"), "");
    EXPECT_TRUE(log.has("the name com.vorlan.pingd is another process's; waiting for it"));
}

}  // namespace
}  // namespace typhon
