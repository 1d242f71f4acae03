#include "platform/linux/bus_message.h"
#include "platform/linux/memory_file.h"
#include "sdk/client_errors.h"
#include "sdk/typhon_client.h"

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <thread>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>

namespace typhon {
namespace {

namespace fs = std::filesystem;
using Dictionary = PropertyList::Dictionary;

const std::string font = "/var/mobile/Library/UserFonts/FontFiles/x/a.ttf";

/// A service on a socket that serves one connection in a thread of its own, until the client is gone or a
/// handler ends it.
class FakeService {
public:
    /// Answers a call; false ends the connection instead.
    using Handler = std::function<bool(sd_bus_message*)>;

    FakeService(const fs::path& path, Handler handler) : handler_(std::move(handler))
    {
        fs::create_directories(path.parent_path());
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strcpy(address.sun_path, path.c_str());
        listener_ = FileDescriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        EXPECT_EQ(::bind(listener_.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(::listen(listener_.get(), 4), 0);
        thread_ = std::thread([this] { serve(); });
    }
    ~FakeService()
    {
        // Wakes an accept that nobody came to.
        ::shutdown(listener_.get(), SHUT_RDWR);
        thread_.join();
    }

private:
    void serve()
    {
        const int connection = ::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC);
        sd_bus* bus = nullptr;
        if (connection < 0 || sd_bus_new(&bus) < 0) {
            return;
        }
        sd_id128_t identifier{};
        sd_bus_set_fd(bus, connection, connection);
        sd_bus_set_server(bus, 1, identifier);
        sd_bus_set_anonymous(bus, 1);
        sd_bus_negotiate_fds(bus, 1);
        sd_bus_add_filter(bus, nullptr, handle, this);
        sd_bus_start(bus);
        while (!isOver_ && sd_bus_is_open(bus) > 0) {
            const int outcome = sd_bus_process(bus, nullptr);
            if (outcome < 0 || (outcome == 0 && sd_bus_wait(bus, UINT64_MAX) < 0)) {
                break;
            }
        }
        sd_bus_flush_close_unref(bus);
    }

    static int handle(sd_bus_message* message, void* self, sd_bus_error*)
    {
        auto& service = *static_cast<FakeService*>(self);
        service.isOver_ =
            sd_bus_message_is_method_call(message, nullptr, nullptr) > 0 && !service.handler_(message);
        return 1;
    }

    Handler handler_;
    FileDescriptor listener_;
    bool isOver_ = false;
    std::thread thread_;
};

/// A handler that answers every call with these arguments.
FakeService::Handler answering(const std::string& types, const Arguments& arguments)
{
    return [=](sd_bus_message* call) {
        sd_bus_message* reply = nullptr;
        sd_bus_message_new_method_return(call, &reply);
        EXPECT_GE(appendArguments(reply, types, arguments, true), 0);
        sd_bus_send(nullptr, reply, nullptr);
        sd_bus_message_unref(reply);
        return true;
    };
}

FakeService::Handler failingWith(const char* name)
{
    return [=](sd_bus_message* call) {
        sd_bus_reply_method_errorf(call, name, "said %s", "no");
        return true;
    };
}

class Client : public testing::Test {
protected:
    Client()
    {
        std::string pattern = fs::temp_directory_path() / "typhon-client-XXXXXX";
        root_ = ::mkdtemp(pattern.data());
    }
    ~Client() override { fs::remove_all(root_); }

    FakeService daemon(FakeService::Handler handler)
    {
        return service("com.vorlan.typhond", std::move(handler));
    }
    FakeService broker(FakeService::Handler handler)
    {
        return service("com.vorlan.typhond.file-access", std::move(handler));
    }
    TyphonClient connected() const
    {
        auto client = TyphonClient::connect({root_.string()});
        EXPECT_TRUE(client);
        return std::move(*client);
    }
    static FakeService::Handler checkingIn(const PropertyList& view)
    {
        return answering("aa{sv}", {PropertyList(PropertyList::Array{view})});
    }

    fs::path root_;

private:
    FakeService service(const std::string& name, FakeService::Handler handler)
    {
        return FakeService(root_ / "run/typhon" / name, std::move(handler));
    }
};

std::string textOf(const FileDescriptor& file)
{
    char text[64];
    const auto count = ::pread(file.get(), text, sizeof text, 0);
    return std::string(text, count > 0 ? static_cast<std::size_t>(count) : 0);
}

TEST_F(Client, WithoutADaemonSaysSo)
{
    const auto client = TyphonClient::connect({root_.string()});
    ASSERT_FALSE(client);
    EXPECT_EQ(client.error().name, client_errors::serviceUnknown);
}

TEST_F(Client, GetsTheViewOfItsCheckin)
{
    const PropertyList view = Dictionary{{"fontsInfo", Dictionary{{font, Dictionary{}}}}};
    const auto service = daemon(checkingIn(view));
    auto client = connected();
    const auto seen = client.checkin();
    ASSERT_TRUE(seen);
    EXPECT_EQ(*seen, view);
    EXPECT_EQ(client.lastCheckin(), view);
}

TEST_F(Client, GetsALargeViewThroughAMemoryFile)
{
    Dictionary fonts;
    for (int i = 0; i < 5000; ++i) {
        fonts.emplace(font + std::to_string(i), Dictionary{{"familyName", Dictionary{{"A", "B"}}}});
    }
    const PropertyList view = Dictionary{{"fontsInfo", fonts}};
    const auto service = daemon(checkingIn(view));
    EXPECT_EQ(*connected().checkin(), view);
}

TEST_F(Client, TellsANullCheckinFromAnEmptyOne)
{
    const auto service = daemon(answering("aa{sv}", {PropertyList(PropertyList::Array{})}));
    auto client = connected();
    const auto seen = client.checkin();
    ASSERT_TRUE(seen);
    EXPECT_FALSE(seen->has_value());
    EXPECT_FALSE(client.lastCheckin().has_value());
}

TEST_F(Client, HearsAtOnceThatTheDaemonEndedTheConnectionAndEverAfter)
{
    const auto service = daemon([](sd_bus_message*) { return false; });
    auto client = connected();
    const auto first = client.checkin();
    ASSERT_FALSE(first);
    EXPECT_EQ(first.error().name, ipc_errors::disconnected);
    EXPECT_EQ(client.updatingUserFonts().error().name, ipc_errors::disconnected);
}

TEST_F(Client, PassesTheDaemonsErrorsOnWithAdvice)
{
    const auto service = daemon(failingWith(ipc_errors::notSupported));
    const auto outcome = connected().resetIssuedFontsFor("org.example.writer");
    ASSERT_FALSE(outcome);
    EXPECT_EQ(outcome.error().name, ipc_errors::notSupported);
    EXPECT_EQ(outcome.error().message, "said no");
    EXPECT_NE(outcome.error().advice, "");
}

TEST_F(Client, RefusesAnAnswerOfAnotherKind)
{
    const auto service = daemon(answering("s", {PropertyList("text")}));
    EXPECT_EQ(connected().checkin().error().name, client_errors::inconsistentMessage);
}

TEST_F(Client, RedeemsTheTokenOfAFileAtTheBroker)
{
    const Data token{{'t', 0}};
    const auto service =
        daemon(checkingIn(Dictionary{{"fontsInfo", Dictionary{{font, Dictionary{{"data", token}}}}}}));
    std::optional<Arguments> asked;
    const auto files = broker([&](sd_bus_message* call) {
        asked = readArguments(call, "ays");
        const char text[] = {'f', 'o', 'n', 't'};
        const auto bytes = std::span(reinterpret_cast<const std::uint8_t*>(text), sizeof text);
        std::shared_ptr<TransferredFile> file =
            std::make_shared<LinuxTransferredFile>(sealedMemoryFile(bytes));
        return answering("h", {file})(call);
    });
    auto client = connected();
    ASSERT_TRUE(client.checkin());
    const auto file = client.openFont(font);
    ASSERT_TRUE(file) << file.error().message;
    EXPECT_EQ(textOf(*file), "font");
    ASSERT_TRUE(asked);
    EXPECT_EQ(std::get<PropertyList>(asked->at(0)), PropertyList(token));
    EXPECT_EQ(std::get<PropertyList>(asked->at(1)), PropertyList(font));
}

TEST_F(Client, AsksWithoutATokenForAFileThatWasNotGranted)
{
    const auto service = daemon(answering("aa{sv}", {PropertyList(PropertyList::Array{})}));
    const auto files = broker(failingWith(ipc_errors::accessDenied));
    auto client = connected();
    const auto file = client.openFont(font);
    ASSERT_FALSE(file);
    EXPECT_EQ(file.error().name, ipc_errors::accessDenied);
}

TEST_F(Client, SaysThatATokenOfAnEarlierDaemonCallsForANewCheckin)
{
    const auto service = daemon(answering("aa{sv}", {PropertyList(PropertyList::Array{})}));
    const auto files = broker(failingWith(client_errors::expired));
    const auto file = connected().redeem(Data{{'t', 0}}, font);
    ASSERT_FALSE(file);
    EXPECT_EQ(file.error().name, client_errors::expired);
    EXPECT_NE(file.error().advice.find("check in again"), std::string::npos);
}

TEST_F(Client, OpensAListedFileWithoutATokenByItself)
{
    fs::create_directories(fs::path(root_.string() + font).parent_path());
    const auto service = daemon(checkingIn(Dictionary{{"fontsInfo", Dictionary{{font, Dictionary{}}}}}));
    auto client = connected();
    ASSERT_TRUE(client.checkin());
    EXPECT_EQ(client.openFont(font).error().name, client_errors::fileNotFound);
    EXPECT_EQ(::mkfifo((root_.string() + font).c_str(), 0600), 0);
    EXPECT_FALSE(client.openFont(font));
    fs::remove(root_.string() + font);
    const FileDescriptor made(::open((root_.string() + font).c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    EXPECT_EQ(::write(made.get(), "own", 3), 3);
    const auto file = client.openFont(font);
    ASSERT_TRUE(file);
    EXPECT_EQ(textOf(*file), "own");
    EXPECT_EQ(::fcntl(file->get(), F_GETFL) & O_ACCMODE, O_RDONLY);
}

}  // namespace
}  // namespace typhon
