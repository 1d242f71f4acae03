#include "platform/linux/bus_message.h"
#include "platform/linux/listening_sockets.h"
#include "platform/linux/unix_sockets.h"
#include "sdk/client_errors.h"
#include "sdk/received_changes.h"
#include "sdk/service_connection.h"
#include "sdk/typhon_client.h"
#include "sdk/web_content_process.h"

#include <filesystem>
#include <thread>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>

// What comes to a program unasked: changes of fonts, and fonts for a content process.

namespace typhon {
namespace {

namespace fs = std::filesystem;
using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;
using Strings = std::vector<std::string>;

constexpr std::chrono::seconds patience{60};
const std::string font = "/var/mobile/Library/UserFonts/FontFiles/x/a.ttf";

Arguments addedFont(const std::string& path)
{
    return {PropertyList(Array{Dictionary{{"fontsInfo", Dictionary{{path, Dictionary{}}}}}}),
            PropertyList(Array{Array{"file://" + path}}), PropertyList(Array{})};
}

Arguments removedFont(const std::string& path)
{
    return {PropertyList(Array{PropertyList()}), PropertyList(Array{}),
            PropertyList(Array{Array{"file://" + path}})};
}

/// The daemon's end of a connection, for a test to act on by hand.
class DaemonEnd {
public:
    explicit DaemonEnd(FileDescriptor socket)
    {
        sd_bus_new(&bus_);
        const int descriptor = socket.release();
        sd_bus_set_fd(bus_, descriptor, descriptor);
        sd_bus_set_server(bus_, 1, {});
        sd_bus_set_anonymous(bus_, 1);
        sd_bus_negotiate_fds(bus_, 1);
        sd_bus_start(bus_);
    }
    ~DaemonEnd() { sd_bus_flush_close_unref(bus_); }
    DaemonEnd(const DaemonEnd&) = delete;
    DaemonEnd& operator=(const DaemonEnd&) = delete;

    void send(const wire::Operation& operation, const Arguments& arguments)
    {
        auto* call = callOf(operation, arguments);
        sd_bus_message_set_expect_reply(call, 0);
        EXPECT_GE(sd_bus_send(bus_, call, nullptr), 0);
        EXPECT_GE(sd_bus_flush(bus_), 0);
        sd_bus_message_unref(call);
    }
    /// Empty when it was answered, else the error's name.
    std::string call(const wire::Operation& operation, const Arguments& arguments)
    {
        auto* call = callOf(operation, arguments);
        sd_bus_error error = SD_BUS_ERROR_NULL;
        sd_bus_message* reply = nullptr;
        const int outcome = sd_bus_call(bus_, call, UINT64_MAX, &error, &reply);
        const std::string name = outcome >= 0 ? "" : error.name == nullptr ? "?" : error.name;
        sd_bus_error_free(&error);
        sd_bus_message_unref(reply);
        sd_bus_message_unref(call);
        return name;
    }

private:
    sd_bus_message* callOf(const wire::Operation& operation, const Arguments& arguments)
    {
        sd_bus_message* call = nullptr;
        sd_bus_message_new_method_call(bus_, &call, nullptr, "/com/vorlan/typhond", operation.interface,
                                       operation.member);
        EXPECT_GE(appendArguments(call, operation.inTypes, arguments, true), 0);
        return call;
    }
    sd_bus* bus_ = nullptr;
};

class FontChanges : public testing::Test {
protected:
    FontChanges()
    {
        std::string pattern = fs::temp_directory_path() / "typhon-changes-XXXXXX";
        root_ = ::mkdtemp(pattern.data());
        fs::create_directories(root_ + "/run/typhon");
        listening_ = listenAt(root_ + "/run/typhon", wire::serviceName).socket;
        auto connected = TyphonClient::connect({root_});
        client.emplace(std::move(*connected));
        daemon = std::make_unique<DaemonEnd>(
            FileDescriptor(::accept4(listening_.get(), nullptr, nullptr, SOCK_CLOEXEC)));
    }
    ~FontChanges() override { fs::remove_all(root_); }

    /// Runs what the daemon does beside what the client does.
    void finishHandshake()
    {
        std::thread other([this] { daemon->send(wire::fontAddedInfo, removedFont("/handshake")); });
        const auto first = client->waitForChange(patience);
        other.join();
        ASSERT_TRUE(first);
        ASSERT_TRUE(*first);
    }

    std::optional<TyphonClient> client;
    std::unique_ptr<DaemonEnd> daemon;

private:
    std::string root_;
    FileDescriptor listening_;
};

TEST_F(FontChanges, AreWaitedForAndComeInTheirOrder)
{
    finishHandshake();
    daemon->send(wire::fontAddedInfo, addedFont(font));
    daemon->send(wire::fontAddedInfo, removedFont(font));
    const auto added = client->waitForChange(patience);
    ASSERT_TRUE(added && *added);
    EXPECT_EQ((*added)->info, PropertyList(Dictionary{{"fontsInfo", Dictionary{{font, Dictionary{}}}}}));
    EXPECT_EQ((*added)->addedURLStrings, Strings{"file://" + font});
    EXPECT_EQ((*added)->removedURLStrings, std::nullopt);
    const auto removed = client->waitForChange(patience);
    ASSERT_TRUE(removed && *removed);
    EXPECT_EQ((*removed)->info, PropertyList());
    EXPECT_EQ((*removed)->addedURLStrings, std::nullopt);
    EXPECT_EQ((*removed)->removedURLStrings, Strings{"file://" + font});
}

TEST_F(FontChanges, AreNotThereWhenNoneCame)
{
    finishHandshake();
    const auto waited = client->waitForChange(std::chrono::milliseconds(0));
    ASSERT_TRUE(waited);
    EXPECT_FALSE(*waited);
    EXPECT_TRUE(client->processPending()->empty());
}

TEST_F(FontChanges, AnnounceThemselvesAtTheDescriptor)
{
    finishHandshake();
    EXPECT_TRUE(client->processPending()->empty());
    pollfd watched{client->descriptor(), POLLIN, 0};
    EXPECT_EQ(::poll(&watched, 1, 0), 0);
    daemon->send(wire::fontAddedInfo, addedFont(font));
    EXPECT_EQ(::poll(&watched, 1, 60'000), 1);
    EXPECT_EQ(client->processPending()->size(), 1U);
}

TEST_F(FontChanges, ThatCameBeforeTheConnectionEndedAreStillGiven)
{
    finishHandshake();
    daemon->send(wire::fontAddedInfo, addedFont(font));
    daemon.reset();
    const auto last = client->waitForChange(patience);
    ASSERT_TRUE(last);
    EXPECT_TRUE(*last);
    const auto end = client->waitForChange(patience);
    ASSERT_FALSE(end);
    EXPECT_EQ(end.error().name, ipc_errors::disconnected);
    EXPECT_EQ(client->processPending().error().name, ipc_errors::disconnected);
}

TEST_F(FontChanges, OfAnotherShapeAndOtherCallsAreRefusedAndHarmNothing)
{
    finishHandshake();
    auto wrong = wire::fontAddedInfo;
    wrong.inTypes = "s";
    auto other = wire::checkin;
    std::thread asking([&] {
        EXPECT_EQ(daemon->call(wrong, {PropertyList("text")}), ipc_errors::unknownMethod);
        EXPECT_EQ(daemon->call(other, {}), ipc_errors::unknownMethod);
        daemon->send(wire::fontAddedInfo, addedFont(font));
    });
    const auto change = client->waitForChange(patience);
    asking.join();
    ASSERT_TRUE(change && *change);
    EXPECT_EQ((*change)->addedURLStrings, Strings{"file://" + font});
}

TEST(ReceivedChangesTest, KeepsTheLatestOfThoseThatNobodyAskedFor)
{
    ReceivedChanges changes;
    for (std::size_t number = 0; number < ReceivedChanges::most + 2; ++number) {
        changes.add(addedFont("/" + std::to_string(number)));
    }
    EXPECT_EQ(changes.lost(), 2U);
    EXPECT_EQ(changes.take()->addedURLStrings, Strings{"file:///2"});
}

TEST(ReceivedChangesTest, RemembersTheGrantsOfWhatCameAndIsStillThere)
{
    ReceivedChanges changes;
    const Data token{{1, 0}};
    auto own = addedFont("/own.ttf");
    own.front() = PropertyList(Array{
        Dictionary{{"fontsInfo", Dictionary{{"/own.ttf", Dictionary{}}}}, {"extension.provider", token}}});
    changes.add(own);
    changes.add(addedFont(font));
    changes.add(removedFont("/own.ttf"));
    EXPECT_EQ(changes.grants(), PropertyList(Dictionary{{"fontsInfo", Dictionary{{font, Dictionary{}}}},
                                                        {"extension.provider", token}}));
    changes.forgetGrants();
    EXPECT_EQ(changes.grants(), PropertyList(Dictionary{{"fontsInfo", Dictionary{}}}));
}

/// The daemon's connection to a content process.
std::unique_ptr<DaemonEnd> connectTo(const WebContentProcess& content)
{
    return std::make_unique<DaemonEnd>(connectToDescriptor(content.endpoint().get()).socket);
}

TEST(WebContentProcessTest, AnswersThePingAndReceivesItsFonts)
{
    auto listening = WebContentProcess::listen();
    auto& content = *listening;
    const PropertyList info = Dictionary{{"fontsInfo", Dictionary{{font, Dictionary{}}}}};
    std::thread other([&] {
        const auto daemon = connectTo(content);
        EXPECT_EQ(daemon->call(wire::pingSilkpageProcess, {}), "");
        EXPECT_EQ(daemon->call(wire::checkin, {}), ipc_errors::unknownMethod);
        EXPECT_EQ(daemon->call(wire::userInstalledFontsInfo, {PropertyList(Array{info})}), "");
    });
    const auto fonts = content.waitForFonts(patience);
    other.join();
    ASSERT_TRUE(fonts && *fonts);
    EXPECT_EQ((*fonts)->info, info);
}

TEST(WebContentProcessTest, TellsNullFromNothing)
{
    auto listening = WebContentProcess::listen();
    auto& content = *listening;
    const auto nothing = content.waitForFonts(std::chrono::milliseconds(0));
    ASSERT_TRUE(nothing);
    EXPECT_FALSE(*nothing);
    std::thread other([&] {
        EXPECT_EQ(connectTo(content)->call(wire::userInstalledFontsInfo, {PropertyList(Array{})}), "");
    });
    const auto fonts = content.waitForFonts(patience);
    other.join();
    ASSERT_TRUE(fonts && *fonts);
    EXPECT_EQ((*fonts)->info, std::nullopt);
}

TEST(WebContentProcessTest, ServesTheDaemonAlsoWhenOthersWhoHoldTheEndpointComeFirst)
{
    auto listening = WebContentProcess::listen();
    auto& content = *listening;
    const auto silent = connectToDescriptor(content.endpoint().get());
    ASSERT_TRUE(silent.socket);
    {
        const auto garbage = connectToDescriptor(content.endpoint().get());
        EXPECT_EQ(::send(garbage.socket.get(), "GET /\r\n\r\n", 9, MSG_NOSIGNAL), 9);
    }
    std::thread other([&] {
        EXPECT_EQ(connectTo(content)->call(wire::userInstalledFontsInfo, {PropertyList(Array{})}), "");
    });
    const auto fonts = content.waitForFonts(patience);
    other.join();
    ASSERT_TRUE(fonts);
    EXPECT_TRUE(*fonts);
}

}  // namespace
}  // namespace typhon
