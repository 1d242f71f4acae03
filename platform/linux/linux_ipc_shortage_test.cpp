// What becomes of peers when the process may hardly open anything any more.

#include "testing/ipc_service.h"
#include "testing/wire_message.h"

#include <algorithm>

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>

namespace typhon {
namespace {

/// Lowers the limit on descriptors, so that it takes few to reach it.
class FewDescriptors {
public:
    FewDescriptors()
    {
        ::getrlimit(RLIMIT_NOFILE, &previous_);
        rlimit lower = previous_;
        lower.rlim_cur = std::min<rlim_t>(previous_.rlim_cur, 256);
        ::setrlimit(RLIMIT_NOFILE, &lower);
    }
    FewDescriptors(const FewDescriptors&) = delete;
    FewDescriptors& operator=(const FewDescriptors&) = delete;
    ~FewDescriptors() { ::setrlimit(RLIMIT_NOFILE, &previous_); }

private:
    rlimit previous_{};
};

/// Takes every free one of them.
class NoDescriptorsLeft : FewDescriptors {
public:
    NoDescriptorsLeft()
    {
        for (;;) {
            FileDescriptor one(::open("/dev/null", O_RDONLY | O_CLOEXEC));
            if (!one) {
                break;
            }
            fillers_.push_back(std::move(one));
        }
    }

private:
    std::vector<FileDescriptor> fillers_;
};

/// Sends a line of the handshake; whether it is answered.
bool isAnswered(const FileDescriptor& socket, std::string_view line)
{
    ::send(socket.get(), line.data(), line.size(), MSG_NOSIGNAL);
    pollfd waiting{socket.get(), POLLIN, 0};
    char answer[256];
    return ::poll(&waiting, 1, 20'000) == 1 && ::read(socket.get(), answer, sizeof answer) > 0;
}

constexpr std::string_view firstLines("\0AUTH EXTERNAL\r\nDATA\r\n", 23);

/// Connects for as long as newcomers are let in, without ever finishing a handshake.
std::vector<FileDescriptor> crowdOf(const TestedService& service)
{
    std::vector<FileDescriptor> crowd;
    do {
        crowd.push_back(rawConnection(service.path()));
    } while (isAnswered(crowd.back(), firstLines));
    return crowd;
}

TEST(LinuxIpcShortage, WithoutDescriptorsNewcomersAreTurnedAway)
{
    TestedService service;
    ForeignClient before(service.path());
    ASSERT_TRUE(before.isAlive());
    std::vector<FileDescriptor> sockets;
    for (int times = 0; times < 3; ++times) {
        sockets.emplace_back(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    }
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    service.path().copy(address.sun_path, sizeof address.sun_path - 1);
    {
        const NoDescriptorsLeft shortage;
        for (const auto& socket : sockets) {
            ASSERT_EQ(::connect(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
            EXPECT_TRUE(isClosedByPeer(socket.get()));
        }
        EXPECT_EQ(service.log.countContaining("are refused: Too many open files"), 1U);
        EXPECT_TRUE(before.isAlive());
    }
    ForeignClient after(service.path());
    EXPECT_TRUE(after.isAlive());
}

TEST(LinuxIpcShortage, TheLastDescriptorsAreKeptForThoseWhoAreConnected)
{
    TestedService service;
    service.delegate->object->view =
        PropertyList(PropertyList::Dictionary{{"large", PropertyList(std::string(100000, 'x'))}});
    const FewDescriptors shortage;
    ForeignClient connected(service.path());
    ASSERT_TRUE(connected.isAlive());
    const auto hesitant = rawConnection(service.path());
    ASSERT_TRUE(isAnswered(hesitant, firstLines));
    const auto crowd = crowdOf(service);
    EXPECT_EQ(service.log.countContaining("are refused: Too many open files"), 1U);

    EXPECT_EQ(connected.call("view"), "");
    ASSERT_TRUE(isAnswered(hesitant, "NEGOTIATE_UNIX_FD\r\n"));
    const std::string text = "late";
    write(hesitant, "BEGIN\r\n" + WireMessage::call(1, testedInterface, "note", &text));
    EXPECT_TRUE(service.log.waitFor("noted late"));
}

TEST(LinuxIpcShortage, WhoComesAndGoesAtTheLimitIsLoggedOnce)
{
    TestedService service;
    const FewDescriptors shortage;
    auto crowd = crowdOf(service);
    for (int times = 0; times < 5; ++times) {
        crowd.resize(crowd.size() / 2);
        auto more = crowdOf(service);
        std::ranges::move(more, std::back_inserter(crowd));
    }
    EXPECT_EQ(service.log.countContaining("are refused: Too many open files"), 1U);
}

}  // namespace
}  // namespace typhon
