// The service side as foreign clients see it, well-behaved and otherwise.

#include "platform/linux/bus_message.h"
#include "platform/linux/linux_ipc.h"
#include "platform/linux/listening_sockets.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/unix_sockets.h"
#include "testing/ipc_service.h"
#include "testing/wire_message.h"

#include <array>
#include <filesystem>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>

namespace typhon {
namespace {

using testing::HasSubstr;

TEST(LinuxIpc, TheSocketIsForEverybody)
{
    const TestedService service;
    struct stat status {};
    ASSERT_EQ(::stat(service.path().c_str(), &status), 0);
    EXPECT_TRUE(S_ISSOCK(status.st_mode));
    EXPECT_EQ(status.st_mode & 0777, 0666U);
}

TEST(LinuxIpc, IntrospectionLeadsToTheObjectAndListsItsMembers)
{
    const TestedService service;
    ForeignClient client(service.path());
    const std::array<std::array<const char*, 2>, 4> ways = {{{"/", "com"},
                                                             {"/com", "vorlan"},
                                                             {"/com/vorlan", "typhond"},
                                                             {"/com/vorlan/typhond", testedInterface}}};
    for (const auto& [path, name] : ways) {
        EXPECT_EQ(client.finish(client.newCall("Introspect", "org.freedesktop.DBus.Introspectable", path)),
                  "");
        EXPECT_THAT(client.text(), HasSubstr("name=\"" + std::string(name) + "\""));
    }
    EXPECT_THAT(client.text(), HasSubstr("<method name=\"echo\">\n   <arg type=\"s\" direction=\"in\"/>\n"
                                         "   <arg type=\"s\" direction=\"out\"/>"));
    EXPECT_THAT(client.text(), HasSubstr("org.freedesktop.DBus.Properties"));
    EXPECT_EQ(client.finish(client.newCall("Introspect", "org.freedesktop.DBus.Introspectable", "/con")),
              "org.freedesktop.DBus.Error.UnknownObject");
}

TEST(LinuxIpc, StandardInterfacesAnswer)
{
    const TestedService service;
    ForeignClient client(service.path());
    EXPECT_EQ(client.finish(client.newCall("Ping", "org.freedesktop.DBus.Peer")), "");
    EXPECT_EQ(client.finish(client.newCall("Hello", "org.freedesktop.DBus", "/org/freedesktop/DBus")), "");
    EXPECT_EQ(client.text(), ":1.1");
    EXPECT_EQ(client.finish(client.newCall("ListNames", "org.freedesktop.DBus", "/org/freedesktop/DBus")),
              "org.freedesktop.DBus.Error.UnknownObject");
    auto* all = client.newCall("GetAll", "org.freedesktop.DBus.Properties");
    sd_bus_message_append(all, "s", testedInterface);
    EXPECT_EQ(client.finish(all), "");
    EXPECT_STREQ(sd_bus_message_get_signature(client.reply, 1), "a{sv}");
    auto* unknown = client.newCall("GetAll", "org.freedesktop.DBus.Properties");
    sd_bus_message_append(unknown, "s", "com.vorlan.unknown");
    EXPECT_EQ(client.finish(unknown), "org.freedesktop.DBus.Error.UnknownInterface");
    auto* one = client.newCall("Get", "org.freedesktop.DBus.Properties");
    sd_bus_message_append(one, "ss", testedInterface, "Anything");
    EXPECT_EQ(client.finish(one), "org.freedesktop.DBus.Error.UnknownProperty");
}

TEST(LinuxIpc, WhatDoesNotExistHasItsErrors)
{
    const TestedService service;
    ForeignClient client(service.path());
    EXPECT_EQ(client.call("absent"), ipc_errors::unknownMethod);
    EXPECT_EQ(client.finish(client.newCall("echo", "com.vorlan.absent")),
              "org.freedesktop.DBus.Error.UnknownInterface");
    EXPECT_EQ(client.finish(client.newCall("echo", testedInterface, "/elsewhere")),
              "org.freedesktop.DBus.Error.UnknownObject");
    EXPECT_EQ(client.call("echo"), ipc_errors::invalidArguments);
    EXPECT_TRUE(client.isAlive());
}

TEST(LinuxIpc, TheInterfaceMayBeLeftOut)
{
    const TestedService service;
    ForeignClient client(service.path());
    auto* call = client.newCall("echo", nullptr);
    sd_bus_message_append(call, "s", "hello");
    EXPECT_EQ(client.finish(call), "");
    EXPECT_EQ(client.text(), "hello");
}

TEST(LinuxIpc, UserZeroOfANamespaceIsServedAnonymously)
{
    const TestedService service;
    const auto socket = rawConnection(service.path());
    // It claims to be user 0, which the kernel denies; then it asks for less.
    write(socket, std::string(1, '\0') + "AUTH EXTERNAL 333939393939\r\nAUTH ANONYMOUS\r\nBEGIN\r\n");
    const std::string text = "hello";
    write(socket, WireMessage::call(1, testedInterface, "note", &text));
    service.delegate->object->release();
    EXPECT_TRUE(const_cast<AwaitedLog&>(service.log).waitFor("noted hello"));
}

TEST(LinuxIpc, MessagesMayFollowTheHandshakeAtOnce)
{
    TestedService service;
    const auto socket = rawConnection(service.path());
    std::string bytes = pipelinedHandshake();
    for (int number = 0; number < 5; ++number) {
        const auto text = "message " + std::to_string(number);
        bytes += WireMessage::call(static_cast<std::uint32_t>(number) + 1, testedInterface, "note", &text);
    }
    write(socket, bytes);
    EXPECT_TRUE(service.log.waitFor("noted message 4"));
    EXPECT_EQ(service.log.countContaining("noted message"), 5U);
}

TEST(LinuxIpc, MessagesMayComeByteByByte)
{
    TestedService service;
    const auto socket = rawConnection(service.path());
    const std::string text = "slow";
    const auto bytes = pipelinedHandshake() + WireMessage::call(1, testedInterface, "note", &text) +
                       WireMessage::call(2, testedInterface, "note", &text);
    for (const char byte : bytes) {
        write(socket, std::string_view(&byte, 1));
    }
    EXPECT_TRUE(service.log.waitFor("noted slow", 2));
}

TEST(LinuxIpc, PathsMayBeLongerThanASocketAddress)
{
    const std::string below = "/" + std::string(100, 'a') + "/" + std::string(100, 'b');
    TestedService service({}, below);
    EXPECT_EQ(service.log.countContaining("cannot listen"), 0U);
    EXPECT_GT(service.path().size(), sizeof(sockaddr_un::sun_path));
    const auto socket = rawConnection(service.path());
    const std::string text = "far away";
    write(socket, pipelinedHandshake() + WireMessage::call(1, testedInterface, "note", &text));
    EXPECT_TRUE(service.log.waitFor("noted far away"));
}

TEST(LinuxIpc, ANameIsTriedForUntilAKilledProcessAndItsChildrenAreGone)
{
    TestedService service;
    service.listener->invalidate();
    // What a killed process left behind, with a child that has not yet executed its program.
    auto left = listenForService(service.root, testedService);
    ASSERT_TRUE(left.socket);
    const auto waiting = service.ipc->listenerForService(testedService);
    waiting->setDelegate(service.delegate);
    waiting->resume();
    EXPECT_EQ(service.log.countContaining("listening on com.vorlan.test"), 0U);
    left = ListeningSocket();
    EXPECT_TRUE(service.log.waitFor("listening on com.vorlan.test"));
    ForeignClient client(service.path());
    EXPECT_TRUE(client.isAlive());
    EXPECT_EQ(service.log.countContaining("another process serves com.vorlan.test; trying again"), 1U);
    EXPECT_EQ(service.log.countContaining("cannot listen"), 0U);
}

TEST(LinuxIpc, ANameThatStaysTakenIsGivenUp)
{
    const TestedService first;
    IpcLimits limits;
    limits.nameOfService = std::chrono::nanoseconds(0);
    AwaitedLog log;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    LinuxIpc ipc(pool, queues, log, first.root, tokenOfPeer, limits);
    const auto second = ipc.listenerForService(testedService);
    second->resume();
    EXPECT_TRUE(log.waitFor("cannot listen on com.vorlan.test: another process serves it"));
}

TEST(LinuxIpc, ANameIsNotTriedForAfterInvalidation)
{
    TestedService service;
    const auto second = service.ipc->listenerForService(testedService);
    const auto third = service.ipc->listenerForService(testedService);
    second->resume();
    second->invalidate();
    third->setDelegate(service.delegate);
    third->resume();
    service.listener->invalidate();
    EXPECT_TRUE(service.log.waitFor("listening on com.vorlan.test"));
    ForeignClient client(service.path());
    EXPECT_TRUE(client.isAlive()) << "the third is there, and the second was not in its way";
}

TEST(LinuxIpc, ASocketLeftBehindIsReplacedALiveOneIsNot)
{
    TestedService service;
    LinuxIpc second(service.pool, service.queues, service.log, service.root, tokenOfPeer);
    const auto refused = second.listenerForService(testedService);
    refused->resume();
    EXPECT_EQ(service.log.countContaining("another process serves com.vorlan.test; trying again"), 1U);
    ForeignClient client(service.path());
    EXPECT_TRUE(client.isAlive());

    refused->invalidate();
    service.listener->invalidate();
    EXPECT_NE(::access(service.path().c_str(), F_OK), 0);
    const auto stale = listenAt(service.root.real("/run/typhon"), testedService);
    ASSERT_TRUE(stale.socket);
    const auto replacing = second.listenerForService(testedService);
    replacing->setDelegate(service.delegate);
    replacing->resume();
    if (service.log.countContaining("trying again") > 1) {
        // The thread that accepted the client held the name for a moment longer.
        ASSERT_TRUE(service.log.waitFor("listening on com.vorlan.test"));
    }
    ForeignClient again(service.path());
    EXPECT_TRUE(again.isAlive());
}

TEST(LinuxIpc, AListenerThatCannotBeIsLoggedOnceAndAcceptsNothing)
{
    TestedService service;
    service.listener->invalidate();
    std::filesystem::create_directory(service.path());
    const auto listener = service.ipc->listenerForService(testedService);
    listener->setDelegate(service.delegate);
    listener->resume();
    EXPECT_EQ(service.log.countContaining("cannot listen on com.vorlan.test: "), 1U);
    EXPECT_EQ(service.ipc->listenerForService("../escape")->endpoint(), nullptr);
    EXPECT_EQ(service.log.countContaining("it is not the name of a service"), 1U);
}

TEST(LinuxIpc, ASocketIsTakenFromTheServiceManager)
{
    // In a process of its own: the descriptor has to be number 3.
    const TestFolder folder;
    const auto handed = listenAt(folder.path, "handed");
    ASSERT_TRUE(handed.socket);
    const pid_t child = ::fork();
    if (child == 0) {
        ::dup2(handed.socket.get(), 3);
        ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
        ::setenv("LISTEN_FDS", "1", 1);
        ::setenv("LISTEN_FDNAMES", testedService, 1);
        const RootDirectory root(folder.path);
        const auto first = listenForService(root, testedService);
        const auto other = listenForService(root, "com.vorlan.other");
        const auto second = listenForService(root, testedService);
        const bool right = first.socket.get() == 3 && first.path.empty() && !other.path.empty() &&
                           second.socket && second.socket.get() != 3;
        ::_exit(right ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

TEST(LinuxIpc, LargeValuesTravelAsSharedSealedFiles)
{
    TestedService service;
    const PropertyList large(std::string(100000, 'x'));
    service.delegate->object->view =
        PropertyList(PropertyList::Dictionary{{"large", large}, {"small", PropertyList(7)}});
    std::array<struct stat, 2> files{};
    for (auto& file : files) {
        ForeignClient client(service.path());
        ASSERT_EQ(client.call("view"), "");
        const auto arguments = readArguments(client.reply, "a{sv}");
        ASSERT_TRUE(arguments);
        EXPECT_EQ(arguments->front(), Argument(service.delegate->object->view));
        sd_bus_message_rewind(client.reply, 1);
        int descriptor = -1;
        ASSERT_GT(sd_bus_message_enter_container(client.reply, 'a', "{sv}"), 0);
        ASSERT_GT(sd_bus_message_enter_container(client.reply, 'e', "sv"), 0);
        ASSERT_GT(sd_bus_message_skip(client.reply, "s"), 0);
        ASSERT_GT(sd_bus_message_read(client.reply, "v", "h", &descriptor), 0);
        ASSERT_EQ(::fstat(descriptor, &file), 0);
        EXPECT_EQ(::lseek(descriptor, 0, SEEK_CUR), 0) << "an offset of its own";
        EXPECT_EQ(::fcntl(descriptor, F_GETFL) & O_ACCMODE, O_RDONLY);
        ::lseek(descriptor, 100, SEEK_SET);
    }
    EXPECT_EQ(files[0].st_ino, files[1].st_ino) << "encoded once";
}

TEST(LinuxIpc, LargeValuesTravelInlineToPeersWithoutDescriptors)
{
    TestedService service;
    service.delegate->object->view =
        PropertyList(PropertyList::Dictionary{{"large", PropertyList(std::string(100000, 'x'))}});
    ForeignClient client(service.path(), false);
    ASSERT_EQ(client.call("view"), "");
    int descriptor = -1;
    const char* text = nullptr;
    ASSERT_GT(sd_bus_message_enter_container(client.reply, 'a', "{sv}"), 0);
    ASSERT_GT(sd_bus_message_enter_container(client.reply, 'e', "sv"), 0);
    ASSERT_GT(sd_bus_message_skip(client.reply, "s"), 0);
    EXPECT_LT(sd_bus_message_read(client.reply, "v", "h", &descriptor), 0);
    EXPECT_GT(sd_bus_message_read(client.reply, "v", "s", &text), 0);
}

std::string sendDictionaryWithFile(ForeignClient& client, int file)
{
    auto* call = client.newCall("dictionary");
    sd_bus_message_append(call, "a{sv}", 1, "key", "h", file);
    return client.finish(call);
}

TEST(LinuxIpc, IncomingMemoryFilesMustBeSealedPropertyLists)
{
    TestedService service;
    ForeignClient client(service.path());
    const auto good = sealedMemoryFile(writeBinaryPropertyList(PropertyList("value")));
    EXPECT_EQ(sendDictionaryWithFile(client, good.get()), "");
    const auto answer = readArguments(client.reply, "a{sv}");
    ASSERT_TRUE(answer);
    EXPECT_EQ(answer->front(), Argument(PropertyList(PropertyList::Dictionary{{"key", "value"}})));

    const auto text = writeXmlPropertyList(PropertyList("value"));
    const std::vector<std::uint8_t> xml(text.begin(), text.end());
    EXPECT_EQ(sendDictionaryWithFile(client, sealedMemoryFile(xml).get()), ipc_errors::invalidArguments);
    const FileDescriptor unsealed(::memfd_create("unsealed", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    const auto bytes = writeBinaryPropertyList(PropertyList("value"));
    ASSERT_EQ(::write(unsealed.get(), bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    EXPECT_EQ(sendDictionaryWithFile(client, unsealed.get()), ipc_errors::invalidArguments);
    const FileDescriptor device(::open("/dev/zero", O_RDONLY | O_CLOEXEC));
    EXPECT_EQ(sendDictionaryWithFile(client, device.get()), ipc_errors::invalidArguments);
    EXPECT_TRUE(client.isAlive());
}

/// A connection to an endpoint, and what became of it.
class EndpointAttempt {
public:
    EndpointAttempt(TestedService& service, FileDescriptor file, std::optional<AuditToken> sender)
        : connection_(service.ipc->connectionToEndpoint(
              std::make_shared<LinuxTransferredFile>(std::move(file), sender)))
    {
        connection_->setInvalidationHandler([&service] { TYLog(service.log, "endpoint refused"); });
        connection_->resume();
    }
    ~EndpointAttempt() { connection_->invalidate(); }

private:
    std::shared_ptr<Connection> connection_;
};

TEST(LinuxIpc, AnEndpointMustBeASocketOfItsSender)
{
    TestedService service;
    const auto own = [&] {
        const auto socket = rawConnection(service.path());
        return tokenOfPeer(socket.get());
    }();
    ASSERT_NE(own, AuditToken{});
    const auto openSocket = [&] {
        return FileDescriptor(::open(service.path().c_str(), O_PATH | O_CLOEXEC));
    };
    const EndpointAttempt file(service, FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC)), own);
    EXPECT_TRUE(service.log.waitFor("the endpoint is not a socket"));
    AuditToken somebodyElse = own;
    ++somebodyElse.effectiveUser;
    const EndpointAttempt stolen(service, openSocket(), somebodyElse);
    EXPECT_TRUE(service.log.waitFor("the endpoint belongs to another user than its sender"));
    EXPECT_TRUE(service.log.waitFor("endpoint refused", 2));
    const EndpointAttempt rightful(service, openSocket(), own);
    EXPECT_EQ(service.log.countContaining("cannot connect"), 2U);
}

TEST(LinuxIpc, ConnectionsToItsEndpointsCountForAProcessUntilTheyEnd)
{
    IpcLimits limits;
    limits.connectionsPerProcess = 2;
    TestedService service(limits);
    const TestFolder folder;
    const auto listening = listenAt(folder.path, "silent");
    ASSERT_TRUE(listening.socket);
    const auto attempt = [&] {
        return std::make_unique<EndpointAttempt>(
            service, FileDescriptor(::open((folder.path + "/silent").c_str(), O_PATH | O_CLOEXEC)),
            std::nullopt);
    };
    auto first = attempt();
    const auto second = attempt();
    EXPECT_EQ(service.log.countContaining("cannot connect"), 0U);
    const auto third = attempt();
    EXPECT_TRUE(service.log.waitFor("its process has too many connections"));
    EXPECT_TRUE(service.log.waitFor("endpoint refused"));
    first.reset();
    EXPECT_TRUE(service.log.waitFor("endpoint refused", 2));
    const auto fourth = attempt();
    EXPECT_EQ(service.log.countContaining("cannot connect"), 1U);
}

TEST(LinuxIpc, AnEndpointWhoseMakerIsGoneIsRefused)
{
    bool gone = false;
    TestedService service({}, {}, [&](int socket) { return gone ? AuditToken{} : tokenOfPeer(socket); });
    gone = true;
    const EndpointAttempt attempt(service, FileDescriptor(::open(service.path().c_str(), O_PATH | O_CLOEXEC)),
                                  std::nullopt);
    EXPECT_TRUE(service.log.waitFor("the process behind the endpoint cannot be identified"));
    EXPECT_TRUE(service.log.waitFor("endpoint refused"));
}

}  // namespace
}  // namespace typhon
