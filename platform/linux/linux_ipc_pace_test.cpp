// Large messages, and peers that send faster than they are answered: they hold up themselves only.

#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_writer.h"
#include "testing/ipc_service.h"
#include "testing/wire_message.h"

#include <array>
#include <atomic>
#include <functional>
#include <future>
#include <string>

#include <sys/socket.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;

IpcLimits pacedLimits()
{
    IpcLimits limits;
    limits.pace = {.allowance = 1h, .oneIn = 2, .connection = 1us, .longestRest = 100ms};
    return limits;
}

/// A dictionary in a message, with one value that is a memory file of many megabytes.
sd_bus_message* largeCall(ForeignClient& client)
{
    PropertyList::Array values;
    while (values.size() < 200'000) {
        values.emplace_back("the value number " + std::to_string(values.size()));
    }
    const auto file = sealedMemoryFile(writeBinaryPropertyList(PropertyList(std::move(values))));
    auto* call = client.newCall("dictionary");
    EXPECT_GE(sd_bus_message_append(call, "a{sv}", 1, "large", "h", file.get()), 0);
    return call;
}

/// Occupies a queue until it is destroyed.
class Occupation {
public:
    explicit Occupation(WorkQueue& queue)
    {
        const std::function<void()> occupy = [this] {
            // Nothing of this object is touched once it may be destroyed.
            const auto left = left_.get_future();
            occupied_.set_value();
            left.wait();
        };
        queue.async(occupy);
        occupied_.get_future().wait();
    }
    ~Occupation() { left_.set_value(); }

private:
    std::promise<void> occupied_;
    std::promise<void> left_;
};

TEST(LinuxIpcPace, ALargeValueHoldsUpNeitherItsOwnLinkNorOthers)
{
    TestedService service(pacedLimits());
    ForeignClient client(service.path());
    ForeignClient other(service.path());
    client.start("hold");
    ASSERT_GE(sd_bus_flush(client.bus), 0);
    ASSERT_TRUE(service.log.waitFor("holding a call"));
    std::uint64_t cookie = 0;
    auto* call = largeCall(client);
    {
        const Occupation nothingLargeIsDecoded(service.ipc->largeMessages());
        ASSERT_GE(sd_bus_send(client.bus, call, &cookie), 0);
        ASSERT_GE(sd_bus_flush(client.bus), 0);
        // Others are served, and the link is written to.
        EXPECT_EQ(other.call("releaseAll"), "");
        pollfd answered{sd_bus_get_fd(client.bus), POLLIN, 0};
        EXPECT_EQ(::poll(&answered, 1, 20'000), 1);
        EXPECT_TRUE(other.isAlive());
    }
    // What comes behind it comes later.
    EXPECT_TRUE(client.isAlive());
    sd_bus_message_unref(call);
    EXPECT_EQ(client.finish(largeCall(client)), "");
}

TEST(LinuxIpcPace, AConnectionMayEndWhileItsLargeValueWaits)
{
    TestedService service(pacedLimits());
    {
        const Occupation nothingLargeIsDecoded(service.ipc->largeMessages());
        ForeignClient client(service.path());
        auto* call = largeCall(client);
        ASSERT_GE(sd_bus_send(client.bus, call, nullptr), 0);
        ASSERT_GE(sd_bus_flush(client.bus), 0);
        sd_bus_message_unref(call);
    }
    ForeignClient other(service.path());
    EXPECT_EQ(other.finish(largeCall(other)), "");
}

TEST(LinuxIpcPace, WhoSendsFasterThanItIsAnsweredRestsAndLosesNothing)
{
    auto limits = pacedLimits();
    limits.pace.allowance = 1ns;
    limits.pace.longestRest = 5ms;
    TestedService service(limits);
    const std::string text = "paced";
    std::string burst;
    for (int count = 0; count < 200; ++count) {
        burst += WireMessage::call(1, testedInterface, "note", &text);
    }
    const auto socket = rawConnection(service.path());
    write(socket, pipelinedHandshake() + burst);
    EXPECT_TRUE(service.log.waitFor("noted paced", 200));
}

/// Stays with its first call after it has answered it, until it is told to leave.
class LingeringObject : public ExportedObject {
public:
    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        call->reply(call->arguments());
        if (!hasLingered_.exchange(true)) {
            lingers.set_value();
            left.get_future().wait();
        }
        co_return;
    }
    std::promise<void> lingers;
    std::promise<void> left;

private:
    std::atomic<bool> hasLingered_ = false;
};

class LingeringDelegate : public ListenerDelegate {
public:
    bool listener(Listener&, std::shared_ptr<Connection> connection) override
    {
        connection->setExportedInterfaces(std::make_shared<const std::vector<InterfaceDescription>>(
            std::vector<InterfaceDescription>{{testedInterface, {{"echo", "s", "s"}}}}));
        connection->setExportedObject(object);
        connection->resume();
        return true;
    }
    const std::shared_ptr<LingeringObject> object = std::make_shared<LingeringObject>();
};

bool hasAnswer(const ForeignClient& client)
{
    pollfd answered{sd_bus_get_fd(client.bus), POLLIN, 0};
    return ::poll(&answered, 1, 20'000) == 1;
}

TEST(LinuxIpcPace, WhoWaitsForEachAnswerNeverRestsHoweverFastItGoesOn)
{
    auto limits = pacedLimits();
    // A single message that counts would be more than the client can wait for.
    limits.pace = {.allowance = 1ns, .oneIn = 1'000'000'000, .connection = 0ns, .longestRest = 1h};
    TestedService service(limits);
    const auto delegate = std::make_shared<LingeringDelegate>();
    service.listener->setDelegate(delegate);
    ForeignClient client(service.path());
    ASSERT_TRUE(client.isAlive());
    // The thread that answered has not come back to look, and finds this when it does.
    auto* next = client.newCall("echo");
    ASSERT_GE(sd_bus_message_append(next, "s", "next"), 0);
    std::uint64_t cookie = 0;
    ASSERT_GE(sd_bus_send(client.bus, next, &cookie), 0);
    sd_bus_message_unref(next);
    delegate->object->left.set_value();
    ASSERT_TRUE(hasAnswer(client));
    EXPECT_TRUE(client.isAlive());
}

/// A connection over which so many calls come in one piece with the end of the handshake, whose beginning was
/// answered before.
FileDescriptor callsBehindHandshake(const TestedService& service, int calls)
{
    const auto handshake = pipelinedHandshake();
    const auto begin = handshake.find("DATA");
    const std::string text = "hasty";
    std::string burst = handshake.substr(begin);
    for (int count = 0; count < calls; ++count) {
        burst += WireMessage::call(1, testedInterface, "echo", &text);
    }
    auto socket = rawConnection(service.path());
    write(socket, handshake.substr(0, begin));
    std::array<char, 64> answer;
    EXPECT_GT(::recv(socket.get(), answer.data(), answer.size(), 0), 0);
    write(socket, burst);
    return socket;
}

TEST(LinuxIpcPace, WhatFollowsTheHandshakeIsReadOnlyAsItIsHandled)
{
    for (int times = 0; times < 20; ++times) {
        TestedService service;
        const auto delegate = std::make_shared<LingeringDelegate>();
        service.listener->setDelegate(delegate);
        const auto socket = callsBehindHandshake(service, 100);
        delegate->object->lingers.get_future().wait();
        // Time for another thread to read on, up to the limit of what may be unanswered.
        ForeignClient other(service.path());
        for (int count = 0; count < 20; ++count) {
            EXPECT_TRUE(other.isAlive());
        }
        delegate->object->left.set_value();
        ::shutdown(socket.get(), SHUT_WR);
        EXPECT_TRUE(isClosedByPeer(socket.get()));
        ASSERT_EQ(service.log.countContaining("too many unanswered calls"), 0U);
    }
}

TEST(LinuxIpcPace, WhoDoesNotWaitForItsAnswersRests)
{
    auto limits = pacedLimits();
    limits.pace = {.allowance = 1ns, .oneIn = 1'000'000, .connection = 0ns, .longestRest = 200ms};
    TestedService service(limits);
    const std::string text = "hastily";
    std::string burst;
    for (int count = 0; count < 50; ++count) {
        burst += WireMessage::call(1, testedInterface, "note", &text);
    }
    const auto begin = std::chrono::steady_clock::now();
    const auto socket = rawConnection(service.path());
    write(socket, pipelinedHandshake() + burst);
    EXPECT_TRUE(service.log.waitFor("noted hastily", 50));
    EXPECT_GE(std::chrono::steady_clock::now() - begin, 190ms);
}

TEST(LinuxIpcPace, APeerMayLeaveWhileItRestsWithAnswersUnread)
{
    auto limits = pacedLimits();
    limits.pace.allowance = 1ns;
    TestedService service(limits);
    std::string burst;
    for (int count = 0; count < 500; ++count) {
        burst += WireMessage::call(1, "org.freedesktop.DBus.Introspectable", "Introspect");
    }
    for (int times = 0; times < 20; ++times) {
        const auto socket = rawConnection(service.path());
        write(socket, pipelinedHandshake() + burst);
    }
    ForeignClient other(service.path());
    EXPECT_TRUE(other.isAlive());
}

}  // namespace
}  // namespace typhon
