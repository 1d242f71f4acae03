// What a peer may cost, and what becomes of one that costs more.

#include "platform/linux/descriptor_passing.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_writer.h"
#include "testing/ipc_service.h"
#include "testing/wire_message.h"

#include <algorithm>
#include <span>
#include <thread>

#include <fcntl.h>
#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

namespace typhon {
namespace {

constexpr std::chrono::seconds patience{20};

/// A client that is served; tried for anew where the service may refuse it for a while.
std::unique_ptr<ForeignClient> servedClient(const TestedService& service)
{
    const auto deadline = std::chrono::steady_clock::now() + patience;
    auto client = std::make_unique<ForeignClient>(service.path());
    while (!client->isAlive() && std::chrono::steady_clock::now() < deadline) {
        client = std::make_unique<ForeignClient>(service.path());
    }
    return client;
}

TEST(LinuxIpcLimits, AHandshakeMustEndInTime)
{
    IpcLimits limits;
    limits.handshake = std::chrono::milliseconds(50);
    TestedService service(limits);
    const auto finished = servedClient(service);
    ASSERT_TRUE(finished->isAlive());
    const auto silent = rawConnection(service.path());
    auto partial = rawConnection(service.path());
    while (!wasSent(partial, std::string(1, '\0') + "AUTH EXTE")) {
        // Its time was up before it began.
        partial = rawConnection(service.path());
    }
    EXPECT_TRUE(isClosedByPeer(silent.get()));
    EXPECT_TRUE(isClosedByPeer(partial.get()));
    EXPECT_TRUE(service.log.waitFor("did not finish the handshake in time"));
    EXPECT_TRUE(finished->isAlive());
}

TEST(LinuxIpcLimits, HalfAMessageHurtsNobodyElse)
{
    TestedService service;
    ForeignClient other(service.path());
    {
        const auto socket = rawConnection(service.path());
        const std::string text = "never whole";
        const auto message = WireMessage::call(1, testedInterface, "note", &text);
        write(socket, pipelinedHandshake() + message.substr(0, message.size() / 2));
        EXPECT_TRUE(other.isAlive());
    }
    EXPECT_TRUE(other.isAlive());
    EXPECT_EQ(service.log.countContaining("never whole"), 0U);
}

TEST(LinuxIpcLimits, GarbageEndsTheConnectionOnly)
{
    TestedService service;
    ForeignClient other(service.path());
    const auto early = rawConnection(service.path());
    write(early, "GET / HTTP/1.1\r\n\r\n");
    EXPECT_TRUE(isClosedByPeer(early.get()));
    const auto late = rawConnection(service.path());
    write(late, pipelinedHandshake() + std::string(64, '\xAA'));
    EXPECT_TRUE(isClosedByPeer(late.get()));
    EXPECT_TRUE(other.isAlive());
}

TEST(LinuxIpcLimits, AnInvalidMessageDoesNotOpenTheWayForALargerOne)
{
    IpcLimits limits;
    limits.message.bytes = 64U << 10;
    TestedService service(limits);
    const std::string small = "small";
    const std::string large(100U << 10, 'x');
    const auto invalid = WireMessage::call(1, "no interface", "note", &small);
    const auto socket = rawConnection(service.path());
    // The kernel sends it in several pieces, and after the first the connection may be closed already.
    wasSent(socket, pipelinedHandshake() + invalid + WireMessage::call(1, testedInterface, "note", &large));
    EXPECT_TRUE(isClosedByPeer(socket.get()));
    EXPECT_EQ(service.log.countContaining("something that is no message"), 1U);
    EXPECT_EQ(service.log.countContaining("noted"), 0U);
}

TEST(LinuxIpcLimits, AMessageIsLimitedInSize)
{
    IpcLimits limits;
    limits.message.bytes = 64U << 10;
    TestedService service(limits);
    ForeignClient fits(service.path());
    EXPECT_EQ(fits.callText("echo", std::string(60U << 10, 'x')), "");
    EXPECT_NE(fits.callText("echo", std::string(80U << 10, 'x')), "");
    // Its beginning is enough.
    const auto socket = rawConnection(service.path());
    const std::string small = "small";
    const std::string large(200U << 10, 'x');
    write(socket, pipelinedHandshake() + WireMessage::call(1, testedInterface, "note", &small));
    ASSERT_TRUE(service.log.waitFor("noted small"));
    write(socket, WireMessage::call(2, testedInterface, "note", &large).substr(0, 16));
    EXPECT_TRUE(isClosedByPeer(socket.get()));
    EXPECT_EQ(service.log.countContaining("its message is too large"), 1U);
}

/// Waits until the peer has read everything.
void drain(const FileDescriptor& socket)
{
    for (int unread = 1; unread > 0;) {
        ASSERT_EQ(::ioctl(socket.get(), SIOCOUTQ, &unread), 0);
        std::this_thread::yield();
    }
}

TEST(LinuxIpcLimits, ASplitMessageIsLimitedInSize)
{
    IpcLimits limits;
    limits.message.bytes = 64U << 10;
    TestedService service(limits);
    const auto socket = rawConnection(service.path());
    const std::string large(200U << 10, 'x');
    const auto message = WireMessage::call(1, testedInterface, "note", &large);
    write(socket, pipelinedHandshake() + message.substr(0, 5));
    drain(socket);
    bool isRefused = false;
    std::size_t sent = 5;
    for (; sent < 64U << 10 && !isRefused; sent += 5) {
        const auto part = std::string_view(message).substr(sent, 5);
        isRefused = ::send(socket.get(), part.data(), part.size(), MSG_NOSIGNAL) < 0;
        drain(socket);
    }
    EXPECT_LE(sent, 32U) << "its header is enough";
    EXPECT_TRUE(isClosedByPeer(socket.get()));
    EXPECT_EQ(service.log.countContaining("noted x"), 0U);
}

TEST(LinuxIpcLimits, MessagesInPiecesAreUnderstoodHoweverTheyAreCut)
{
    TestedService service;
    const auto socket = rawConnection(service.path());
    write(socket, pipelinedHandshake());
    std::size_t noted = 0;
    const std::string text = "pieces";
    for (const std::size_t size : {1, 3, 15, 16, 17, 40}) {
        const auto message =
            WireMessage::call(static_cast<std::uint32_t>(++noted), testedInterface, "note", &text);
        for (std::size_t at = 0; at < message.size(); at += size) {
            write(socket, std::string_view(message).substr(at, size));
            drain(socket);
        }
        ASSERT_TRUE(service.log.waitFor("noted pieces", noted)) << size;
    }
    // Large ones, and several at once.
    const std::string large(300U << 10, 'x');
    const auto many = WireMessage::call(20, testedInterface, "note", &large) +
                      WireMessage::call(21, testedInterface, "note", &text) +
                      WireMessage::call(22, testedInterface, "note", &large);
    for (std::string_view rest = many; !rest.empty();) {
        const auto sent = ::send(socket.get(), rest.data(), rest.size(), MSG_NOSIGNAL);
        ASSERT_GT(sent, 0);
        rest.remove_prefix(static_cast<std::size_t>(sent));
    }
    EXPECT_TRUE(service.log.waitFor("noted x", 2));
    EXPECT_TRUE(service.log.waitFor("noted pieces", noted + 1));
}

/// Sends bytes together with so many descriptors.
ssize_t sendWithDescriptors(int socket, std::string_view bytes, std::size_t count)
{
    const FileDescriptor file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    const std::span data(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
    return typhon::sendWithDescriptors(socket, data, std::vector<int>(count, file.get()));
}

TEST(LinuxIpcLimits, DescriptorsOfHalfAMessageAreLimited)
{
    TestedService service;
    const auto socket = rawConnection(service.path());
    const std::string text = "never whole";
    const auto message = WireMessage::call(1, testedInterface, "note", &text);
    write(socket, pipelinedHandshake());
    std::size_t sent = 0;
    while (sent < message.size() - 1 &&
           sendWithDescriptors(socket.get(), std::string_view(message).substr(sent, 1), 6) == 1) {
        ++sent;
        drain(socket);
    }
    EXPECT_LE(sent, 4U);
    EXPECT_TRUE(isClosedByPeer(socket.get()));
    EXPECT_EQ(service.log.countContaining("too many descriptors"), 1U);
}

std::size_t openDescriptors()
{
    const std::filesystem::directory_iterator all("/proc/self/fd");
    return static_cast<std::size_t>(std::distance(begin(all), end(all)));
}

/// False when there are more, or fewer, for long. One more is open for a moment while the pool starts a
/// thread, which gets its name through a file.
bool waitForOpenDescriptors(std::size_t count)
{
    const auto deadline = std::chrono::steady_clock::now() + patience;
    while (openDescriptors() != count) {
        if (std::chrono::steady_clock::now() >= deadline) {
            return false;
        }
        std::this_thread::yield();
    }
    return true;
}

TEST(LinuxIpcLimits, DescriptorsOfInvalidMessagesAreClosed)
{
    TestedService service;
    const std::string text = "text";
    const auto before = openDescriptors();
    const std::string messages[] = {WireMessage::call(1, "no interface", "note", &text, 4),
                                    WireMessage::call(1, testedInterface, "note", &text, 3),
                                    WireMessage::call(1, testedInterface, "note", &text)};
    for (const auto& message : messages) {
        const auto socket = rawConnection(service.path());
        write(socket, pipelinedHandshake());
        ASSERT_EQ(sendWithDescriptors(socket.get(), message, 4), static_cast<ssize_t>(message.size()));
        EXPECT_TRUE(isClosedByPeer(socket.get()));
    }
    EXPECT_TRUE(waitForOpenDescriptors(before));
    EXPECT_EQ(service.log.countContaining("something that is no message"), 1U);
}

TEST(LinuxIpcLimits, NothingBehindAnInvalidMessageIsHandled)
{
    TestedService service;
    const std::string text = "text";
    const std::string behind = "behind";
    const auto invalid = WireMessage::call(1, "no interface", "note", &text);
    const auto before = openDescriptors();
    for (int times = 0; times < 20; ++times) {
        const auto socket = rawConnection(service.path());
        write(socket, pipelinedHandshake() + WireMessage::call(1, testedInterface, "note", &text) + invalid +
                          WireMessage::call(2, testedInterface, "note", &behind) +
                          WireMessage::call(3, "org.freedesktop.DBus.Peer", "Ping"));
        // Gone already, as a rule. sd-bus would lose them, were it to read them.
        sendWithDescriptors(socket.get(), WireMessage::call(4, "no interface", "note", &text, 4), 4);
        EXPECT_TRUE(isClosedByPeer(socket.get()));
    }
    EXPECT_TRUE(service.log.waitFor("noted text", 20));
    EXPECT_EQ(service.log.countContaining("noted behind"), 0U);
    EXPECT_TRUE(waitForOpenDescriptors(before));
}

TEST(LinuxIpcLimits, OddButValidMessagesAreHandled)
{
    TestedService service;
    const std::string text = "odd";
    // A field that nobody knows, in place of one for descriptors.
    auto message = WireMessage::call(1, testedInterface, "note", &text, 1);
    message[message.find("\x09\x01u")] = 77;
    const auto socket = rawConnection(service.path());
    write(socket, pipelinedHandshake() + message + message);
    EXPECT_TRUE(service.log.waitFor("noted odd", 2));
}

TEST(LinuxIpcLimits, AFirstMessageMayCarryDescriptorsRightBehindTheHandshake)
{
    TestedService service;
    const std::string text = "the first";
    const auto message = WireMessage::call(1, testedInterface, "note", &text, 2);
    for (std::size_t times = 1; times <= 50; ++times) {
        const auto socket = rawConnection(service.path());
        write(socket, pipelinedHandshake());
        ASSERT_EQ(sendWithDescriptors(socket.get(), message, 2), static_cast<ssize_t>(message.size()));
        ASSERT_TRUE(service.log.waitFor("noted the first", times));
    }
    // In pieces as well.
    const auto socket = rawConnection(service.path());
    write(socket, pipelinedHandshake());
    ASSERT_EQ(sendWithDescriptors(socket.get(), message.substr(0, 20), 2), 20);
    drain(socket);
    write(socket, message.substr(20));
    EXPECT_TRUE(service.log.waitFor("noted the first", 51));
}

TEST(LinuxIpcLimits, AMessageMustEndInTime)
{
    IpcLimits limits;
    limits.wholeMessage = std::chrono::milliseconds(50);
    TestedService service(limits);
    ForeignClient other(service.path());
    const std::string text = "never whole";
    const auto message = WireMessage::call(1, testedInterface, "note", &text);
    for (const std::size_t size : {std::size_t{1}, message.size() / 2, message.size() - 1}) {
        const auto socket = rawConnection(service.path());
        write(socket, pipelinedHandshake() + message.substr(0, size));
        EXPECT_TRUE(isClosedByPeer(socket.get()));
    }
    EXPECT_EQ(service.log.countContaining("did not finish a message in time"), 1U);
    EXPECT_TRUE(other.isAlive());
}

TEST(LinuxIpcLimits, WhatAProcessLeavesUnfinishedIsLimited)
{
    IpcLimits limits;
    limits.heldBytesPerProcess = 256U << 10;
    TestedService service(limits);
    const std::string large(1U << 20, 'x');
    const auto half = WireMessage::call(1, testedInterface, "note", &large).substr(0, 100U << 10);
    std::vector<FileDescriptor> sockets;
    for (int count = 0; count < 2; ++count) {
        sockets.push_back(rawConnection(service.path()));
        write(sockets.back(), pipelinedHandshake() + half);
        drain(sockets.back());
    }
    const auto excessive = rawConnection(service.path());
    // May be closed in the middle of it.
    wasSent(excessive, pipelinedHandshake() + half);
    EXPECT_TRUE(isClosedByPeer(excessive.get()));
    EXPECT_EQ(service.log.countContaining("too many messages unfinished"), 1U);
    // What was held is free again as soon as the service has seen the ends of the connections.
    sockets.clear();
    const std::string text = "whole" + std::string(150U << 10, 'x');
    const auto whole = WireMessage::call(1, testedInterface, "note", &text);
    const auto deadline = std::chrono::steady_clock::now() + patience;
    while (service.log.countContaining("noted whole") == 0 && std::chrono::steady_clock::now() < deadline) {
        const auto next = rawConnection(service.path());
        wasSent(next, pipelinedHandshake() + whole);
        ::shutdown(next.get(), SHUT_WR);
        EXPECT_TRUE(isClosedByPeer(next.get()));
    }
    EXPECT_TRUE(service.log.waitFor("noted whole"));
}

TEST(LinuxIpcLimits, UnansweredCallsAreLimited)
{
    IpcLimits limits;
    limits.unansweredCalls = 3;
    TestedService service(limits);
    ForeignClient client(service.path());
    for (int times = 0; times < 5; ++times) {
        // Dropped by the service: nobody is left who could answer, so they do not count.
        client.start("never");
        ASSERT_TRUE(client.isAlive());
    }
    for (std::size_t times = 1; times <= 3; ++times) {
        client.start("hold");
        ASSERT_TRUE(service.log.waitFor("holding a call", times));
    }
    EXPECT_EQ(client.call("hold"), ipc_errors::limitsExceeded);
    EXPECT_EQ(client.callText("echo", "x"), ipc_errors::limitsExceeded);
    EXPECT_EQ(service.log.countContaining("too many unanswered calls"), 1U);
    ForeignClient other(service.path());
    EXPECT_TRUE(other.isAlive());
    service.delegate->object->release();
    EXPECT_TRUE(client.isAlive());
}

TEST(LinuxIpcLimits, ConnectionsOfAProcessAreLimited)
{
    IpcLimits limits;
    limits.connectionsPerProcess = 2;
    TestedService service(limits);
    ForeignClient first(service.path());
    auto second = std::make_unique<ForeignClient>(service.path());
    ASSERT_TRUE(first.isAlive());
    ASSERT_TRUE(second->isAlive());
    for (int times = 0; times < 3; ++times) {
        EXPECT_TRUE(isClosedByPeer(rawConnection(service.path()).get()));
    }
    EXPECT_EQ(service.log.countContaining("connections; further ones are refused"), 1U);
    EXPECT_TRUE(first.isAlive());
    second.reset();
    // The place is free as soon as the service has seen the end of the second.
    EXPECT_TRUE(servedClient(service)->isAlive()) << "the place of a closed connection stays taken";
}

TEST(LinuxIpcLimits, WhatAPeerLeavesUnreadIsLimited)
{
    IpcLimits limits;
    limits.queuedBytes = 256U << 10;
    limits.unansweredCalls = 1000;
    TestedService service(limits);
    PropertyList::Dictionary view;
    for (int number = 0; number < 50; ++number) {
        view.emplace(std::to_string(number), std::string(1000, 'x'));
    }
    service.delegate->object->view = PropertyList(view);
    const auto socket = rawConnection(service.path());
    std::string bytes = pipelinedHandshake();
    write(socket, bytes);
    for (std::uint32_t serial = 1; serial <= 300; ++serial) {
        const auto call = WireMessage::call(serial, testedInterface, "view");
        if (::send(socket.get(), call.data(), call.size(), MSG_NOSIGNAL) < 0) {
            break;
        }
    }
    EXPECT_TRUE(service.log.waitFor("bytes unread"));
    ForeignClient other(service.path());
    EXPECT_TRUE(other.isAlive());
}

TEST(LinuxIpcLimits, DescriptorsThatAPeerLeavesUnreadAreLimited)
{
    IpcLimits limits;
    limits.unreadDescriptors = 5;
    TestedService service(limits);
    service.delegate->object->view =
        PropertyList(PropertyList::Dictionary{{"large", PropertyList(std::string(100000, 'x'))}});
    ForeignClient reads(service.path());
    for (int times = 0; times < 20; ++times) {
        ASSERT_EQ(reads.call("view"), "");
    }
    const auto socket = rawConnection(service.path());
    write(socket, pipelinedHandshake());
    for (std::uint32_t serial = 1; serial <= 20; ++serial) {
        const auto call = WireMessage::call(serial, testedInterface, "view");
        if (::send(socket.get(), call.data(), call.size(), MSG_NOSIGNAL) < 0) {
            break;
        }
    }
    EXPECT_TRUE(service.log.waitFor("descriptors unread"));
    EXPECT_TRUE(reads.isAlive());
}

TEST(LinuxIpcLimits, DescriptorsInAMessageAreLimited)
{
    IpcLimits limits;
    limits.message.descriptors = 4;
    TestedService service(limits);
    ForeignClient client(service.path());
    const auto file = sealedMemoryFile(writeBinaryPropertyList(PropertyList("value")));
    for (const int count : {4, 5}) {
        auto* call = client.newCall("dictionary");
        sd_bus_message_open_container(call, 'a', "{sv}");
        for (int number = 0; number < count; ++number) {
            sd_bus_message_append(call, "{sv}", std::to_string(number).c_str(), "h", file.get());
        }
        sd_bus_message_close_container(call);
        EXPECT_EQ(client.finish(call).empty(), count == 4);
    }
}

}  // namespace
}  // namespace typhon
