#include "fontmanager/daemon/helper_life.h"
#include "fontmanager/font_registry_wire.h"
#include "fontmanager/helper_files.h"
#include "platform/linux/listening_sockets.h"
#include "platform/linux/scratch_directory.h"

#include <gtest/gtest.h>
#include <sys/file.h>
#include <unistd.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;

class HelperLifeTest : public testing::Test {
protected:
    const std::chrono::steady_clock::time_point start{1000h};
    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
    ListeningSocket socket = listenForService(root, font_registry_wire::serviceName);
    HelperLife life{root, {.idle = 60s}};
};

TEST_F(HelperLifeTest, WithoutDaemonAndConnectionsItEndsAfterAWhile)
{
    EXPECT_EQ(life.reasonToEnd(0, start), std::nullopt);
    EXPECT_EQ(life.reasonToEnd(0, start + 59s), std::nullopt);
    EXPECT_EQ(life.reasonToEnd(0, start + 60s), "nobody needs it");
}

TEST_F(HelperLifeTest, AConnectionBeginsTheTimeAnew)
{
    EXPECT_EQ(life.reasonToEnd(0, start), std::nullopt);
    EXPECT_EQ(life.reasonToEnd(1, start + 60s), std::nullopt);
    EXPECT_EQ(life.reasonToEnd(0, start + 61s), std::nullopt);
    EXPECT_EQ(life.reasonToEnd(0, start + 120s), std::nullopt);
    EXPECT_EQ(life.reasonToEnd(0, start + 121s), "nobody needs it");
}

TEST_F(HelperLifeTest, BesideADaemonItStays)
{
    auto daemon = listenForService(root, wire::serviceName);
    ASSERT_TRUE(daemon.socket);
    EXPECT_EQ(life.reasonToEnd(0, start), std::nullopt);
    EXPECT_EQ(life.reasonToEnd(0, start + 1h), std::nullopt);
    daemon.lock = FileDescriptor();
    EXPECT_EQ(life.reasonToEnd(0, start + 2h), std::nullopt);
    EXPECT_EQ(life.reasonToEnd(0, start + 3h), "nobody needs it");
}

TEST_F(HelperLifeTest, ItsNameIsFreeWhenTheOneBeforeIsGone)
{
    EXPECT_FALSE(HelperLife::awaitName(root, 0ms));
    socket.lock = FileDescriptor();
    EXPECT_TRUE(HelperLife::awaitName(root));
    EXPECT_TRUE(listenForService(root, font_registry_wire::serviceName).socket) << "it does not keep it";
}

TEST_F(HelperLifeTest, WithItsSocketGoneItEndsAtOnce)
{
    ASSERT_EQ(::unlink(socket.path.c_str()), 0);
    EXPECT_EQ(life.reasonToEnd(1, start), "its socket is gone");
}

TEST_F(HelperLifeTest, WithASocketOfTheServiceManagerItEndsWhenIdle)
{
    const auto daemon = listenForService(root, wire::serviceName);
    HelperLife activated(root, {.idle = 60s, .isSocketActivated = true});
    ::unlink(socket.path.c_str());
    EXPECT_EQ(activated.reasonToEnd(0, start), std::nullopt);
    EXPECT_EQ(activated.reasonToEnd(0, start + 60s), "nobody needs it");
}

TEST_F(HelperLifeTest, ItsProcessIdentifierIsThereWhileItLives)
{
    EXPECT_EQ(HelperLife::announce(root), std::nullopt);
    EXPECT_EQ(scratch.readFile(helper_files::processIdentifier), std::to_string(::getpid()) + "\n");
    HelperLife::withdraw(root);
    EXPECT_EQ(scratch.readFile(helper_files::processIdentifier), "");
}

}  // namespace
}  // namespace typhon
