#include "platform/linux/linux_code_signing.h"
#include "platform/linux/mount_identifier.h"
#include "testing/child_process.h"
#include "testing/forged_executable.h"
#include "testing/scratch_folder.h"

#include <filesystem>
#include <fstream>

#include <gtest/gtest.h>
#include <sched.h>

namespace typhon {
namespace {

using testing::ChildProcess;
using testing::RecordingLog;
using testing::ScratchFolder;

struct LinuxCodeSigningTest : ::testing::Test {
    ScratchFolder folder;
    RecordingLog log;
    EventPool pool;
    ConfinementProbe probe;
    SignatureStore signatures{folder.root, log};
    SandboxInstances instances{probe, signatures, pool};
    LinuxCodeSigning codeSigning{probe, instances, signatures};
    const SigningKey key = generateSigningKey();
    const std::string program = folder.program("program");

    void trust(const SigningKey& which, KeyScope scope = {})
    {
        const auto file = writeTrustedKey(folder.root, {which.publicKey, std::move(scope)});
        ASSERT_TRUE(file.value) << file.error;
    }
    std::string sign(const std::string& path, const std::string& identifier, const SigningKey& with,
                     PropertyList::Dictionary entitlements = {})
    {
        const auto file =
            writeSignature(folder.root, with, {identifier, std::move(entitlements), testing::digestOf(path)});
        EXPECT_TRUE(file.value) << file.error;
        return folder.root.real(file.value.value_or("/"));
    }
    /// The identifier of a process that runs the program; empty without one.
    std::string identifierOf(const std::string& path)
    {
        ChildProcess child({path});
        child.waitForEcho();
        return identifierOf(child.token());
    }
    std::string identifierOf(const AuditToken& token)
    {
        const auto task = codeSigning.taskFromAuditToken(token);
        EXPECT_TRUE(task);
        EXPECT_TRUE(task->signingIdentifier || task->entitlements.empty());
        return task->signingIdentifier.value_or("");
    }
};

TEST_F(LinuxCodeSigningTest, ASignedProgramHasItsIdentifierAndEntitlements)
{
    trust(key);
    sign(program, "org.example.viewer", key, {{"list", PropertyList::Array{"a"}}});
    ChildProcess child({program});
    child.waitForEcho();
    const auto task = codeSigning.taskFromAuditToken(child.token());
    ASSERT_TRUE(task);
    EXPECT_EQ(task->signingIdentifier, "org.example.viewer");
    EXPECT_EQ(task->entitlement("list"), PropertyList(PropertyList::Array{"a"}));
    EXPECT_EQ(task->entitlement("other"), std::nullopt);
}

TEST_F(LinuxCodeSigningTest, ACopyOfASignedProgramIsTheSameProgram)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    const auto copy = folder.path + "/copy";
    std::filesystem::copy_file(program, copy);
    EXPECT_EQ(identifierOf(copy), "org.example.viewer");
}

TEST_F(LinuxCodeSigningTest, AProgramThatNobodySignedIsNobody)
{
    trust(key);
    EXPECT_EQ(identifierOf(program), "");
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(LinuxCodeSigningTest, AProcessThatIsGoneHasNoTask)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    ChildProcess child({program});
    child.waitForEcho();
    const auto token = child.token();
    child.end();
    EXPECT_FALSE(codeSigning.taskFromAuditToken(token));
    EXPECT_FALSE(codeSigning.taskFromAuditToken(AuditToken{}));
}

TEST_F(LinuxCodeSigningTest, AProcessThatBecameAnotherProgramHasNoTaskUnderItsOldToken)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    ChildProcess child({"/bin/sh", "-c", "echo 1; read a; exec " + program});
    ASSERT_EQ(child.read(), "1\n");
    const auto token = child.token();
    EXPECT_EQ(identifierOf(token), "");
    child.write("\n");
    child.waitForEcho();
    EXPECT_FALSE(codeSigning.taskFromAuditToken(token));
    EXPECT_EQ(identifierOf(child.token()), "org.example.viewer");
}

TEST_F(LinuxCodeSigningTest, AChangedProgramIsNobody)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    ASSERT_EQ(identifierOf(program), "org.example.viewer");
    std::ofstream(program, std::ios::binary | std::ios::app) << "changed";
    EXPECT_EQ(identifierOf(program), "");
}

TEST_F(LinuxCodeSigningTest, AProgramIsReadOnce)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    const FileDescriptor directory(::open(folder.path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    std::filesystem::create_symlink(program, folder.path + "/exe");
    struct statx status;
    ASSERT_EQ(::statx(AT_FDCWD, program.c_str(), 0, STATX_MNT_ID_UNIQUE, &status), 0);
    // Older kernels give the numbers of mounts to others again: there it is opened each time.
    const bool isKnownUnopened = (status.stx_mask & STATX_MNT_ID_UNIQUE) != 0;
    SignatureStore::Executable seen;
    // A file that was changed just now might change again without a trace.
    for (int times = 0; times < 10'000 && !seen.digest; ++times) {
        seen = signatures.executableOf(directory.get());
        ASSERT_EQ(signatures.digestOf(seen), testing::digestOf(program));
    }
    EXPECT_EQ(seen.digest.has_value(), isKnownUnopened);
    std::ofstream(program, std::ios::binary | std::ios::app) << "changed";
    const auto changed = signatures.executableOf(directory.get());
    EXPECT_FALSE(changed.digest);
    EXPECT_EQ(signatures.digestOf(changed), testing::digestOf(program));
}

TEST_F(LinuxCodeSigningTest, AProcessKeepsTheProgramItWasStartedFrom)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    ChildProcess child({program});
    child.waitForEcho();
    for (int message = 0; message < 3; ++message) {
        const MessageLooks looks;
        ASSERT_EQ(identifierOf(child.token()), "org.example.viewer");
    }
    const auto other = folder.program("other");
    std::ofstream(other, std::ios::binary | std::ios::app) << "changed";
    std::filesystem::rename(other, program);
    // The process runs the file that it was started from, which has no name any more.
    const MessageLooks looks;
    EXPECT_EQ(identifierOf(child.token()), "org.example.viewer");
    EXPECT_EQ(identifierOf(program), "");
}

TEST_F(LinuxCodeSigningTest, ASignatureByAnUntrustedKeyDoesNotCount)
{
    sign(program, "org.example.viewer", key);
    EXPECT_EQ(identifierOf(program), "");
    EXPECT_TRUE(log.has("its key is not trusted to sign it"));
}

TEST_F(LinuxCodeSigningTest, AKeyCountsFromWhenItIsTrustedUntilItIsRemoved)
{
    sign(program, "org.example.viewer", key);
    EXPECT_EQ(identifierOf(program), "");
    trust(key);
    EXPECT_EQ(identifierOf(program), "org.example.viewer");
    std::filesystem::remove_all(folder.root.real(trustedKeysDirectory));
    EXPECT_EQ(identifierOf(program), "");
}

TEST_F(LinuxCodeSigningTest, AnIdentifierOutsideTheScopeDoesNotCount)
{
    trust(key);
    sign(program, "com.vorlan.viewer", key);
    EXPECT_EQ(identifierOf(program), "");
    const auto other = folder.program("other");
    const auto narrow = generateSigningKey();
    KeyScope scope;
    scope.identifiers = {"org.example."};
    trust(narrow, scope);
    sign(other, "org.elsewhere.viewer", narrow);
    EXPECT_EQ(identifierOf(other), "");
    sign(other, "org.example.viewer", narrow);
    EXPECT_EQ(identifierOf(other), "org.example.viewer");
}

TEST_F(LinuxCodeSigningTest, AnEntitlementOutsideTheScopeSpoilsTheSignature)
{
    KeyScope scope;
    scope.entitlements = {"one"};
    trust(key, scope);
    sign(program, "org.example.viewer", key, {{"one", 1}, {"two", 2}});
    EXPECT_EQ(identifierOf(program), "");
    sign(program, "org.example.viewer", key, {{"one", 1}});
    EXPECT_EQ(identifierOf(program), "org.example.viewer");
}

TEST_F(LinuxCodeSigningTest, ASignatureForAnotherProgramDoesNotCount)
{
    trust(key);
    const auto other = folder.program("other");
    const auto signature = sign(program, "org.example.viewer", key);
    const auto name = hexOf(testing::digestOf(other)) + ".plist";
    std::filesystem::copy_file(signature, std::filesystem::path(signature).parent_path() / name);
    EXPECT_EQ(identifierOf(other), "");
    EXPECT_TRUE(log.has("it is for another executable"));
}

TEST_F(LinuxCodeSigningTest, ASignatureThatOthersCanWriteDoesNotCount)
{
    trust(key);
    ASSERT_EQ(::chmod(sign(program, "org.example.viewer", key).c_str(), 0666), 0);
    EXPECT_EQ(identifierOf(program), "");
}

TEST_F(LinuxCodeSigningTest, ASandboxThatNobodyRegisteredIsNobody)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    for (const auto* unshared : {"--unshare-pid", "--unshare-user"}) {
        ChildProcess child({"bwrap", "--ro-bind", "/", "/", "--die-with-parent", unshared, program});
        child.waitForEcho();
        EXPECT_EQ(identifierOf(child.tokenInside()), "") << unshared;
    }
}

#if defined(__x86_64__)
TEST_F(LinuxCodeSigningTest, AForgedExecutableIsNotBelieved)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    ChildProcess child([this](int stream) {
        if (::unshare(CLONE_NEWUSER) == 0) {
            testing::becomeForged(program, stream);
        }
    });
    ASSERT_EQ(child.read(), std::string(8, '\0'));
    const auto token = child.token();
    // The forgery succeeded: this is what an unwary reader would believe.
    const auto shown = std::filesystem::read_symlink("/proc/" + std::to_string(child.pid()) + "/exe");
    ASSERT_EQ(shown, program);
    EXPECT_EQ(identifierOf(token), "");
}
#endif

TEST_F(LinuxCodeSigningTest, AProgramMountedOverAnotherIsWhatItIs)
{
    trust(key);
    sign(program, "org.example.viewer", key);
    const auto other = folder.program("other");
    ChildProcess child(
        {"bwrap", "--ro-bind", "/", "/", "--die-with-parent", "--ro-bind", other, program, program});
    child.waitForEcho();
    EXPECT_EQ(identifierOf(child.tokenInside()), "");
}

}  // namespace
}  // namespace typhon
