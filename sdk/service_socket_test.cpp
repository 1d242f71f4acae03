#include "sdk/client_errors.h"
#include "sdk/service_socket.h"

#include <cstdlib>
#include <cstring>
#include <filesystem>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

namespace typhon {
namespace {

namespace fs = std::filesystem;

class ServiceSocket : public testing::Test {
protected:
    ServiceSocket()
    {
        std::string pattern = fs::temp_directory_path() / "typhon-socket-XXXXXX";
        folder_ = ::mkdtemp(pattern.data());
    }
    ~ServiceSocket() override { fs::remove_all(folder_); }

    /// Binds by a relative name, since the whole path may be too long for an address.
    static FileDescriptor listenAt(const fs::path& path)
    {
        fs::create_directories(path.parent_path());
        const auto before = fs::current_path();
        fs::current_path(path.parent_path());
        FileDescriptor listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strcpy(address.sun_path, path.filename().c_str());
        EXPECT_EQ(::bind(listener.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(::listen(listener.get(), 4), 0);
        fs::current_path(before);
        return listener;
    }

    fs::path folder_;
};

TEST_F(ServiceSocket, LiesUnderTheRoot)
{
    EXPECT_EQ(serviceSocketPath(RootDirectory{}, "com.vorlan.typhond"), "/run/typhon/com.vorlan.typhond");
    EXPECT_EQ(serviceSocketPath(RootDirectory{"/scratch"}, "x"), "/scratch/run/typhon/x");
}

TEST_F(ServiceSocket, IsConnectedTo)
{
    const auto listener = listenAt(folder_ / "service");
    EXPECT_TRUE(connectToSocket(folder_ / "service"));
}

TEST_F(ServiceSocket, IsConnectedToByAPathLongerThanAnAddress)
{
    const auto path = folder_ / std::string(100, 'a') / std::string(100, 'b') / "service";
    const auto listener = listenAt(path);
    EXPECT_TRUE(connectToSocket(path));
}

TEST_F(ServiceSocket, ThatIsMissingSaysHowToStartTheDaemon)
{
    const auto outcome = connectToSocket(folder_ / "service");
    ASSERT_FALSE(outcome);
    EXPECT_EQ(outcome.error().name, client_errors::serviceUnknown);
    EXPECT_NE(outcome.error().advice, "");
}

TEST_F(ServiceSocket, ThatIsMissingInALongPathSaysTheSame)
{
    const auto outcome = connectToSocket(folder_ / std::string(150, 'a') / "service");
    ASSERT_FALSE(outcome);
    EXPECT_EQ(outcome.error().name, client_errors::serviceUnknown);
}

TEST_F(ServiceSocket, OfAServiceThatIsGoneSaysHowToStartTheDaemon)
{
    listenAt(folder_ / "service");
    const auto outcome = connectToSocket(folder_ / "service");
    ASSERT_FALSE(outcome);
    EXPECT_EQ(outcome.error().name, client_errors::serviceUnknown);
}

TEST_F(ServiceSocket, RootIsTheChosenOneThenTheEnvironmentsThenTheMachines)
{
    ::setenv("TYPHON_ROOT", "/from/environment", 1);
    EXPECT_EQ(chosenRoot("/chosen/").directory(), "/chosen");
    EXPECT_EQ(chosenRoot("/").directory(), "");
    EXPECT_EQ(chosenRoot(std::nullopt).directory(), "/from/environment");
    ::unsetenv("TYPHON_ROOT");
    EXPECT_EQ(chosenRoot(std::nullopt).directory(), "");
    EXPECT_EQ(chosenRoot("relative").directory(), (fs::current_path() / "relative").string());
}

}  // namespace
}  // namespace typhon
