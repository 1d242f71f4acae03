#include "platform/linux/descriptor_passing.h"
#include "platform/linux/inode.h"

#include <array>
#include <cerrno>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

namespace typhon {
namespace {

class DescriptorPassingTest : public testing::Test {
protected:
    void SetUp() override
    {
        std::array<int, 2> pair{};
        ASSERT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair.data()), 0);
        near = FileDescriptor(pair[0]);
        far = FileDescriptor(pair[1]);
        file = FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    }
    ssize_t send(std::size_t count)
    {
        return sendWithDescriptors(near.get(), bytes, std::vector<int>(count, file.get()));
    }
    std::vector<FileDescriptor> receive()
    {
        std::array<std::uint8_t, 16> buffer;
        iovec part{buffer.data(), buffer.size()};
        alignas(cmsghdr) std::array<char, CMSG_SPACE(maximumPassedDescriptors * sizeof(int))> control;
        msghdr message{};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        EXPECT_EQ(::recvmsg(far.get(), &message, MSG_CMSG_CLOEXEC), static_cast<ssize_t>(bytes.size()));
        return takeDescriptors(message);
    }

    const std::vector<std::uint8_t> bytes{1, 2, 3};
    FileDescriptor near;
    FileDescriptor far;
    FileDescriptor file;
};

TEST_F(DescriptorPassingTest, EveryDescriptorArrivesAsOneOfTheReceivers)
{
    for (const std::size_t count : {std::size_t{1}, std::size_t{2}, maximumPassedDescriptors}) {
        ASSERT_EQ(send(count), static_cast<ssize_t>(bytes.size()));
        const auto received = receive();
        ASSERT_EQ(received.size(), count);
        for (const auto& descriptor : received) {
            EXPECT_NE(descriptor.get(), file.get());
            EXPECT_EQ(inodeAt(descriptor.get(), ""), inodeAt(file.get(), ""));
        }
    }
}

TEST_F(DescriptorPassingTest, BytesMayComeWithoutAny)
{
    ASSERT_EQ(send(0), static_cast<ssize_t>(bytes.size()));
    EXPECT_TRUE(receive().empty());
}

TEST_F(DescriptorPassingTest, MoreThanTheKernelPassesAreRefused)
{
    errno = 0;
    EXPECT_EQ(send(maximumPassedDescriptors + 1), -1);
    EXPECT_EQ(errno, EINVAL);
}

}  // namespace
}  // namespace typhon
