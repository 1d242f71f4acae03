// The services of this room over real connections.

#include "platform/linux/audit_tokens.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/file_access_broker.h"
#include "platform/linux/identities_service.h"
#include "platform/linux/linux_ipc.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/sandboxes_service.h"
#include "testing/child_process.h"
#include "testing/scratch_folder.h"

#include <atomic>
#include <chrono>
#include <future>

#include <fcntl.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::ChildProcess;
using testing::RecordingLog;
using testing::ScratchFolder;

constexpr const char* font = "/var/mobile/Library/UserFonts/FontFiles/org.example.foundry/a.ttf";

class NoIdentity : public CodeSigning {
public:
    std::optional<CodeSigningTask> taskFromAuditToken(const AuditToken& token) override
    {
        return token == AuditToken{} ? std::nullopt : std::optional(task);
    }
    CodeSigningTask task;
};

class DecidedSandbox : public Sandbox {
public:
    bool isSandboxed(const AuditToken& token) override { return isEverybody || token == AuditToken{}; }
    bool mayRead(const AuditToken&, const std::string&) override { return false; }
    std::optional<std::string> issueReadExtension(const AuditToken&, const std::string&) override
    {
        return std::nullopt;
    }
    std::atomic<bool> isEverybody = false;
};

Task<void> keepResults(std::shared_ptr<std::promise<CallResult>> promise, Arguments results)
{
    promise->set_value({std::move(results), {}});
    co_return;
}

struct IdentityServicesTest : ::testing::Test {
    ScratchFolder folder;
    RecordingLog log;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    ExtensionTokens tokens;
    NoIdentity identity;
    ConfinementProbe probe;
    SignatureStore signatures{folder.root, log};
    SandboxInstances instances{probe, signatures, pool};
    LinuxIpc ipc{pool, queues, log, folder.root, tokenOfPeer};
    LinuxIpc client{pool, queues, log, folder.root, tokenOfPeer, IpcLimits{}, EndpointHandshake::client};
    const std::shared_ptr<FileAccessBroker> broker =
        std::make_shared<FileAccessBroker>(identity, tokens, folder.root, log);
    const std::shared_ptr<SandboxesService> sandboxes = std::make_shared<SandboxesService>(instances, log);
    DecidedSandbox sandbox;
    const std::shared_ptr<IdentitiesService> identities =
        std::make_shared<IdentitiesService>(identity, sandbox, log);

    IdentityServicesTest()
    {
        std::filesystem::create_directories(folder.path + "/run/typhon");
        startFileAccessService(ipc, broker);
        startSandboxesService(ipc, sandboxes);
        startIdentitiesService(ipc, identities);
    }
    // The end of a connection may still be handled.
    ~IdentityServicesTest() override { pool.stop(); }

    CallResult call(const char* service, const InterfaceDescriptions& interfaces, const char* member,
                    Arguments arguments)
    {
        const auto connection = client.connectionToService(service);
        connection->setRemoteObjectInterfaces(interfaces);
        connection->resume();
        const auto promise = std::make_shared<std::promise<CallResult>>();
        auto outcome = promise->get_future();
        connection->call(
            interfaces->front().name, member, std::move(arguments),
            [promise](Arguments results) { return keepResults(promise, std::move(results)); },
            [promise](const IpcError& error) {
                promise->set_value({std::nullopt, error});
            });
        const bool isAnswered = outcome.wait_for(std::chrono::seconds(30)) == std::future_status::ready;
        auto result = isAnswered ? outcome.get() : CallResult{std::nullopt, {"no answer", ""}};
        connection->invalidate();
        return result;
    }
    CallResult open(const std::string& token, const std::string& path)
    {
        return call(FileAccessBroker::serviceName, FileAccessBroker::interfaces(), "open",
                    {PropertyList(Data{{token.begin(), token.end()}}), PropertyList(path)});
    }
    CallResult registerSandbox(FileDescriptor process, FileDescriptor executable)
    {
        const std::shared_ptr<TransferredFile> first =
            std::make_shared<LinuxTransferredFile>(std::move(process));
        const std::shared_ptr<TransferredFile> second =
            std::make_shared<LinuxTransferredFile>(std::move(executable));
        return call(SandboxesService::serviceName, SandboxesService::interfaces(), "register",
                    {first, second});
    }
    CallResult identify(FileDescriptor process)
    {
        const std::shared_ptr<TransferredFile> file =
            std::make_shared<LinuxTransferredFile>(std::move(process));
        return call(IdentitiesService::serviceName, IdentitiesService::interfaces(), "identify", {file});
    }
    AuditToken me() const
    {
        const auto self = openPidfd(::getpid());
        return tokenOfProcess(self.get());
    }
};

TEST_F(IdentityServicesTest, ATokenIsRedeemedForAnOpenFile)
{
    folder.write(font, "contents");
    const auto result = open(tokens.issue(me(), font).value() + '\0', font);
    ASSERT_TRUE(result.results) << result.error.name << ": " << result.error.message;
    const auto* argument = std::get_if<std::shared_ptr<TransferredFile>>(&result.results->at(0));
    ASSERT_NE(argument, nullptr);
    const auto& file = dynamic_cast<const LinuxTransferredFile&>(**argument).descriptor;
    char text[16] = {};
    EXPECT_EQ(::read(file.get(), text, sizeof text), 8);
    EXPECT_STREQ(text, "contents");
}

TEST_F(IdentityServicesTest, RefusalsAreErrors)
{
    folder.write(font, "contents");
    EXPECT_EQ(open("", font).error.name, ipc_errors::accessDenied);
    const ExtensionTokens earlier;
    EXPECT_EQ(open(earlier.issue(me(), font).value(), font).error.name, "com.vorlan.typhond.Error.Expired");
    const std::string missing = std::string(font) + "2";
    EXPECT_EQ(open(tokens.issue(me(), missing).value(), missing).error.name,
              "org.freedesktop.DBus.Error.FileNotFound");
}

TEST_F(IdentityServicesTest, ASandboxIsRegistered)
{
    ChildProcess child(
        {"bwrap", "--ro-bind", "/", "/", "--die-with-parent", "--unshare-user", "--unshare-pid", "/bin/cat"});
    child.waitForEcho();
    const auto executable = [] { return FileDescriptor(::open("/bin/cat", O_RDONLY | O_CLOEXEC)); };
    const auto first = ChildProcess::firstChildOf(child.pid());
    const auto result = registerSandbox(openPidfd(first), executable());
    EXPECT_TRUE(result.results && result.results->empty())
        << result.error.name << ": " << result.error.message;
    EXPECT_EQ(instances.count(), 1u);
    EXPECT_EQ(registerSandbox(openPidfd(first), executable()).error.name, ipc_errors::failed);
    EXPECT_EQ(registerSandbox(openPidfd(::getpid()), executable()).error.name, ipc_errors::invalidArguments);
    EXPECT_TRUE(log.has("may not register a sandbox"));
}

TEST_F(IdentityServicesTest, AServiceIsToldWhoItsCallerIs)
{
    identity.task = {.signingIdentifier = "org.example.a",
                     .entitlements = {{"capabilities", PropertyList::Array{"one"}}}};
    const auto result = identify(openPidfd(::getpid()));
    ASSERT_TRUE(result.results) << result.error.message;
    EXPECT_EQ(std::get<PropertyList>(result.results->at(0)),
              PropertyList(PropertyList::Dictionary{{"identifier", "org.example.a"},
                                                    {"entitlements", identity.task.entitlements},
                                                    {"sandboxed", false},
                                                    {"user", std::int64_t(::geteuid())}}));
}

TEST_F(IdentityServicesTest, AnUnsignedProgramHasNoIdentifier)
{
    const auto result = identify(openPidfd(::getpid()));
    ASSERT_TRUE(result.results) << result.error.message;
    EXPECT_EQ(std::get<PropertyList>(result.results->at(0)).find("identifier"), nullptr);
}

TEST_F(IdentityServicesTest, WhatIsNoProcessHasNoIdentity)
{
    EXPECT_EQ(identify(FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC))).error.name,
              ipc_errors::failed);
    EXPECT_EQ(identify(FileDescriptor(::open("/proc/self", O_PATH | O_CLOEXEC))).error.name,
              ipc_errors::failed);
}

TEST_F(IdentityServicesTest, ASandboxedProcessMayNotAskWhoOthersAre)
{
    sandbox.isEverybody = true;
    EXPECT_EQ(identify(openPidfd(::getpid())).error.name, ipc_errors::accessDenied);
    EXPECT_TRUE(log.has("may not ask who others are"));
}

}  // namespace
}  // namespace typhon
