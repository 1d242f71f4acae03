#include "platform/linux/linux_code_signing.h"
#include "platform/linux/sandbox_instances.h"
#include "testing/child_process.h"
#include "testing/scratch_folder.h"

#include <filesystem>
#include <thread>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>

namespace typhon {
namespace {

using Refusal = SandboxInstances::Refusal;
using testing::ChildProcess;
using testing::RecordingLog;
using testing::ScratchFolder;

AuditToken ownToken()
{
    const auto self = openPidfd(::getpid());
    return tokenOfProcess(self.get());
}

struct SandboxInstancesTest : ::testing::Test {
    ScratchFolder folder;
    RecordingLog log;
    EventPool pool;
    ConfinementProbe probe;
    SignatureStore signatures{folder.root, log};
    SandboxInstances instances{probe, signatures, pool, {.perUser = 2}};
    LinuxCodeSigning codeSigning{probe, instances, signatures};
    const SigningKey key = generateSigningKey();
    const std::string program = signedProgram("org.example.viewer");
    const FileDescriptor executable{::open(program.c_str(), O_RDONLY | O_CLOEXEC)};

    std::string signedProgram(const std::string& identifier)
    {
        auto path = folder.program(identifier);
        EXPECT_TRUE(writeTrustedKey(folder.root, {key.publicKey, {}}).value);
        EXPECT_TRUE(writeSignature(folder.root, key, {identifier, {}, testing::digestOf(path)}).value);
        return path;
    }

    /// cat in a sandbox with a process namespace of its own.
    static std::vector<std::string> sandboxOf(std::vector<std::string> command = {"/bin/cat"})
    {
        std::vector<std::string> all{
            "bwrap",          "--ro-bind",    "/", "/", "--proc", "/proc", "--die-with-parent",
            "--unshare-user", "--unshare-pid"};
        all.insert(all.end(), command.begin(), command.end());
        return all;
    }

    /// The first process of the sandbox that the child has started.
    static FileDescriptor firstProcessOf(const ChildProcess& child)
    {
        return openPidfd(ChildProcess::firstChildOf(child.pid()));
    }

    Refusal registerAs(const AuditToken& caller, const ChildProcess& sandbox)
    {
        return instances.registerInstance(caller, firstProcessOf(sandbox), executable.get()).refusal;
    }

    std::optional<std::string> identifierInside(const ChildProcess& child)
    {
        const auto task = codeSigning.taskFromAuditToken(child.tokenInside());
        return task ? task->signingIdentifier : std::optional<std::string>("gone");
    }
};

TEST_F(SandboxInstancesTest, ARegisteredSandboxIsTheExecutableItWasStartedFor)
{
    ChildProcess child(sandboxOf());
    child.waitForEcho();
    EXPECT_EQ(identifierInside(child), std::nullopt);
    EXPECT_EQ(registerAs(ownToken(), child), Refusal::none);
    EXPECT_EQ(identifierInside(child), "org.example.viewer");
}

TEST_F(SandboxInstancesTest, WhatItRunsIsStillThatSandbox)
{
    ChildProcess child(sandboxOf({signedProgram("org.example.other")}));
    child.waitForEcho();
    ASSERT_EQ(registerAs(ownToken(), child), Refusal::none);
    EXPECT_EQ(identifierInside(child), "org.example.viewer");
}

TEST_F(SandboxInstancesTest, AnotherSandboxIsNotThatSandbox)
{
    ChildProcess child(sandboxOf());
    ChildProcess other(sandboxOf({program}));
    child.waitForEcho();
    other.waitForEcho();
    ASSERT_EQ(registerAs(ownToken(), child), Refusal::none);
    EXPECT_EQ(identifierInside(other), std::nullopt);
}

TEST_F(SandboxInstancesTest, ASandboxWithinInheritsIt)
{
    ChildProcess child(sandboxOf({"unshare", "--user", "--map-root-user", "--pid", "--fork", "/bin/cat"}));
    child.waitForEcho();
    ASSERT_EQ(registerAs(ownToken(), child), Refusal::none);
    const auto inside = child.tokenInside();
    const FileDescriptor directory(
        ::open(("/proc/" + std::to_string(inside.processIdentifier)).c_str(), O_PATH | O_CLOEXEC));
    const auto first = ChildProcess::firstChildOf(child.pid());
    const FileDescriptor outer(::open(("/proc/" + std::to_string(first)).c_str(), O_PATH | O_CLOEXEC));
    ASSERT_NE(inodeAt(directory.get(), "ns/pid"), inodeAt(outer.get(), "ns/pid"));
    EXPECT_EQ(identifierInside(child), "org.example.viewer");
}

TEST_F(SandboxInstancesTest, ItIsForgottenWhenItsFirstProcessEnds)
{
    ChildProcess child(sandboxOf());
    child.waitForEcho();
    const auto first = firstProcessOf(child);
    ASSERT_EQ(registerAs(ownToken(), child), Refusal::none);
    EXPECT_EQ(instances.count(), 1u);
    // Its launcher may end too early to take it along.
    ASSERT_EQ(::kill(ChildProcess::firstChildOf(child.pid()), SIGKILL), 0);
    ASSERT_TRUE(testing::waitReadable(first.get()));
    while (instances.count() != 0) {
        std::this_thread::yield();
    }
}

TEST_F(SandboxInstancesTest, ItsKeyStillHasToBeTrusted)
{
    ChildProcess child(sandboxOf());
    child.waitForEcho();
    ASSERT_EQ(registerAs(ownToken(), child), Refusal::none);
    ASSERT_EQ(identifierInside(child), "org.example.viewer");
    std::filesystem::remove_all(folder.root.real(trustedKeysDirectory));
    EXPECT_EQ(identifierInside(child), std::nullopt);
}

TEST_F(SandboxInstancesTest, AnUnsignedExecutableGivesNoIdentity)
{
    const auto unsignedProgram = folder.program("unsigned");
    const FileDescriptor file(::open(unsignedProgram.c_str(), O_RDONLY | O_CLOEXEC));
    ChildProcess child(sandboxOf({program}));
    child.waitForEcho();
    EXPECT_EQ(instances.registerInstance(ownToken(), firstProcessOf(child), file.get()).refusal,
              Refusal::none);
    EXPECT_EQ(identifierInside(child), std::nullopt);
}

TEST_F(SandboxInstancesTest, ASandboxedProcessMayNotRegister)
{
    ChildProcess child(sandboxOf());
    child.waitForEcho();
    EXPECT_EQ(registerAs(child.tokenInside(), child), Refusal::notAllowed);
    ChildProcess inUserNamespace([](int stream) {
        if (::unshare(CLONE_NEWUSER) == 0) {
            testing::remain(stream);
        }
    });
    ASSERT_EQ(inUserNamespace.read(), "r");
    EXPECT_EQ(registerAs(inUserNamespace.token(), child), Refusal::notAllowed);
    EXPECT_EQ(registerAs(AuditToken{}, child), Refusal::notAllowed);
    EXPECT_EQ(identifierInside(child), std::nullopt);
}

TEST_F(SandboxInstancesTest, AProcessThatIsGoneMayNotRegister)
{
    ChildProcess child(sandboxOf());
    child.waitForEcho();
    ChildProcess caller({"/bin/cat"});
    caller.waitForEcho();
    const auto token = caller.token();
    caller.end();
    EXPECT_EQ(registerAs(token, child), Refusal::notAllowed);
}

TEST_F(SandboxInstancesTest, AnotherUserMayNotRegisterIt)
{
    ChildProcess child(sandboxOf());
    child.waitForEcho();
    auto stranger = ownToken();
    stranger.effectiveUser = 4711;
    EXPECT_EQ(registerAs(stranger, child), Refusal::notAllowed);
    stranger.effectiveUser = 0;
    EXPECT_EQ(registerAs(stranger, child), Refusal::none);
}

TEST_F(SandboxInstancesTest, OnlyTheFirstProcessOfANamespaceWillDo)
{
    ChildProcess plain({"/bin/cat"});
    plain.waitForEcho();
    const auto registerProcess = [&](FileDescriptor process) {
        return instances.registerInstance(ownToken(), std::move(process), executable.get()).refusal;
    };
    EXPECT_EQ(registerProcess(openPidfd(plain.pid())), Refusal::invalid);
    EXPECT_EQ(registerProcess(openPidfd(::getpid())), Refusal::invalid);
    EXPECT_EQ(registerProcess(openPidfd(1)), Refusal::invalid);
    EXPECT_EQ(registerProcess(FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC))), Refusal::invalid);
    EXPECT_EQ(registerProcess(FileDescriptor()), Refusal::invalid);
    ChildProcess child(sandboxOf({"/bin/sh", "-c", "/bin/cat; true"}));
    child.waitForEcho();
    EXPECT_EQ(registerProcess(openPidfd(child.tokenInside().processIdentifier)), Refusal::invalid);
    EXPECT_EQ(registerAs(ownToken(), child), Refusal::none);
}

TEST_F(SandboxInstancesTest, TheExecutableMustBeAFileOpenedForReading)
{
    ChildProcess child(sandboxOf());
    child.waitForEcho();
    const auto registerWith = [&](const FileDescriptor& file) {
        return instances.registerInstance(ownToken(), firstProcessOf(child), file.get()).refusal;
    };
    EXPECT_EQ(registerWith(FileDescriptor(::open(program.c_str(), O_PATH | O_CLOEXEC))), Refusal::invalid);
    EXPECT_EQ(registerWith(FileDescriptor(::open(program.c_str(), O_WRONLY | O_CLOEXEC))), Refusal::invalid);
    EXPECT_EQ(registerWith(FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC))), Refusal::invalid);
    EXPECT_EQ(registerWith(FileDescriptor(::open("/", O_RDONLY | O_CLOEXEC))), Refusal::invalid);
    EXPECT_EQ(registerWith(FileDescriptor()), Refusal::invalid);
    EXPECT_EQ(instances.count(), 0u);
}

TEST_F(SandboxInstancesTest, ASandboxIsRegisteredOnce)
{
    ChildProcess child(sandboxOf());
    child.waitForEcho();
    EXPECT_EQ(registerAs(ownToken(), child), Refusal::none);
    EXPECT_EQ(registerAs(ownToken(), child), Refusal::alreadyRegistered);
}

TEST_F(SandboxInstancesTest, AUserHasALimitedNumber)
{
    ChildProcess one(sandboxOf());
    ChildProcess two(sandboxOf());
    ChildProcess three(sandboxOf());
    for (const auto* child : {&one, &two, &three}) {
        child->waitForEcho();
    }
    EXPECT_EQ(registerAs(ownToken(), one), Refusal::none);
    EXPECT_EQ(registerAs(ownToken(), two), Refusal::none);
    EXPECT_EQ(registerAs(ownToken(), three), Refusal::tooMany);
}

}  // namespace
}  // namespace typhon
