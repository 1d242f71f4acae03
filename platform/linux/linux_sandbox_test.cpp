#include "platform/linux/linux_sandbox.h"
#include "testing/child_process.h"
#include "testing/scratch_folder.h"

#include <atomic>
#include <filesystem>
#include <thread>

#include <grp.h>
#include <gtest/gtest.h>
#include <sched.h>

namespace typhon {
namespace {

using testing::ChildProcess;
using testing::ScratchFolder;

constexpr const char* font = "/var/mobile/Library/UserFonts/FontFiles/org.example.foundry/a.ttf";
constexpr uid_t otherUser = 65534;

struct LinuxSandboxTest : ::testing::Test {
    ScratchFolder folder;
    ConfinementProbe probe;
    ExtensionTokens tokens;
    LinuxSandbox sandbox{probe, tokens, folder.root};

    std::vector<std::string> inSandbox(std::vector<std::string> options) const
    {
        std::vector<std::string> command{"bwrap", "--ro-bind",         "/",
                                         "/",     "--die-with-parent", "--unshare-pid"};
        command.insert(command.end(), options.begin(), options.end());
        command.push_back("/bin/cat");
        return command;
    }
};

TEST_F(LinuxSandboxTest, AnOrdinaryProcessIsNotSandboxed)
{
    ChildProcess child({"/bin/cat"});
    child.waitForEcho();
    EXPECT_FALSE(sandbox.isSandboxed(child.token()));
}

TEST_F(LinuxSandboxTest, AProcessThatIsGoneIsSandboxedAndGetsNothing)
{
    folder.write(font, "font");
    ChildProcess child({"/bin/cat"});
    child.waitForEcho();
    const auto token = child.token();
    ASSERT_TRUE(sandbox.mayRead(token, font));
    ASSERT_TRUE(sandbox.issueReadExtension(token, font));
    child.end();
    EXPECT_TRUE(sandbox.isSandboxed(token));
    EXPECT_FALSE(sandbox.mayRead(token, font));
    EXPECT_EQ(sandbox.issueReadExtension(token, font), std::nullopt);
    EXPECT_TRUE(sandbox.isSandboxed(AuditToken{}));
}

TEST_F(LinuxSandboxTest, AnOrdinaryProcessReadsWhatItsUserReads)
{
    folder.write(font, "font");
    ChildProcess child({"/bin/cat"});
    child.waitForEcho();
    EXPECT_TRUE(sandbox.mayRead(child.token(), font));
    EXPECT_TRUE(sandbox.mayRead(child.token(), "/var/mobile/Library/UserFonts/FontFiles"));
    EXPECT_TRUE(sandbox.mayRead(child.token(), "/var/mobile/Library/UserFonts/FontFiles/"));
    EXPECT_FALSE(sandbox.mayRead(child.token(), "/var/mobile/Library/UserFonts/FontFiles/missing.ttf"));
    EXPECT_FALSE(sandbox.mayRead(child.token(), "relative"));
    EXPECT_FALSE(sandbox.mayRead(child.token(), ""));
    EXPECT_FALSE(sandbox.mayRead(child.token(), std::string("/var\0x", 6)));
}

TEST_F(LinuxSandboxTest, ASandboxReadsWhatItSees)
{
    folder.write(font, "font");
    ChildProcess child(inSandbox({}));
    child.waitForEcho();
    EXPECT_TRUE(sandbox.isSandboxed(child.tokenInside()));
    EXPECT_TRUE(sandbox.mayRead(child.tokenInside(), font));
}

TEST_F(LinuxSandboxTest, ASandboxDoesNotReadWhatIsHiddenFromIt)
{
    folder.write(font, "font");
    ChildProcess child(inSandbox({"--tmpfs", folder.root.real("/var/mobile/Library/UserFonts")}));
    child.waitForEcho();
    EXPECT_FALSE(sandbox.mayRead(child.tokenInside(), font));
    EXPECT_FALSE(sandbox.mayRead(child.tokenInside(), "/var/mobile/Library/UserFonts/FontFiles"));
}

TEST_F(LinuxSandboxTest, AnotherFileAtTheSamePathIsNotTheFile)
{
    const auto real = folder.write(font, "font");
    const auto other = folder.write("/other.ttf", "other");
    ChildProcess child(inSandbox({"--ro-bind", other, real}));
    child.waitForEcho();
    EXPECT_FALSE(sandbox.mayRead(child.tokenInside(), font));
}

TEST_F(LinuxSandboxTest, AProcessIsAskedInTheRootThatItHasAtEachMessage)
{
    folder.write(font, "font");
    ChildProcess child([](int stream) {
        char byte = 'r';
        [[maybe_unused]] auto length = ::write(stream, &byte, 1);
        length = ::read(stream, &byte, 1);
        if ((::geteuid() == 0 || ::unshare(CLONE_NEWUSER) == 0) && ::chroot("/usr") == 0) {
            testing::remain(stream);
        }
    });
    ASSERT_EQ(child.read(), "r");
    const auto token = child.token();
    {
        const MessageLooks message;
        EXPECT_FALSE(sandbox.isSandboxed(token));
        EXPECT_TRUE(sandbox.mayRead(token, font));
    }
    child.write("x");
    ASSERT_EQ(child.read(), "r");
    const MessageLooks message;
    EXPECT_TRUE(sandbox.isSandboxed(token));
    EXPECT_FALSE(sandbox.mayRead(token, font));
}

TEST_F(LinuxSandboxTest, TheFileItselfAtTheLogicalPathIsFound)
{
    const auto real = folder.write(font, "font");
    const std::string directory = std::filesystem::path(real).parent_path();
    ChildProcess child({"bwrap", "--tmpfs", "/", "--ro-bind", "/usr", "/usr", "--symlink", "usr/lib", "/lib",
                        "--symlink", "usr/lib64", "/lib64", "--ro-bind", directory,
                        std::filesystem::path(font).parent_path(), "--unshare-pid", "--die-with-parent",
                        "/usr/bin/cat"});
    child.waitForEcho();
    EXPECT_TRUE(sandbox.mayRead(child.tokenInside(), font));
}

TEST_F(LinuxSandboxTest, ASymbolicLinkInsideLeadsNoFurtherThanTheSandbox)
{
    const auto real = folder.write(font, "font");
    // The link's target exists for the daemon, not for the sandbox.
    ChildProcess child({"bwrap", "--tmpfs", "/", "--ro-bind", "/usr", "/usr", "--symlink", "usr/lib", "/lib",
                        "--symlink", "usr/lib64", "/lib64", "--symlink", real, font, "--unshare-pid",
                        "--die-with-parent", "/usr/bin/cat"});
    child.waitForEcho();
    EXPECT_FALSE(sandbox.mayRead(child.tokenInside(), font));
}

TEST_F(LinuxSandboxTest, PermissionsOfTheProcessCountNotThoseOfTheDaemon)
{
    const auto real = folder.write(font, "font", 0600);
    if (::geteuid() != 0) {
        // An ordinary user's daemon has no process of another user to ask about, and may not pretend to be
        // one.
        BorrowedCredentials credentials;
        EXPECT_FALSE(credentials.ask({otherUser, otherUser, {}, 0}, [] { FAIL() << "was asked"; }));
        ASSERT_EQ(::chmod(real.c_str(), 0), 0);
        ChildProcess child({"/bin/cat"});
        child.waitForEcho();
        EXPECT_FALSE(sandbox.mayRead(child.token(), font));
        return;
    }
    const gid_t extra[] = {4711};
    ChildProcess child([&](int stream) {
        if (::setgroups(1, extra) == 0 && ::setresgid(otherUser, otherUser, otherUser) == 0 &&
            ::setresuid(otherUser, otherUser, otherUser) == 0) {
            testing::remain(stream);
        }
    });
    ASSERT_EQ(child.read(), "r");
    const auto token = child.token();
    EXPECT_FALSE(sandbox.mayRead(token, font));
    ASSERT_EQ(::chmod(real.c_str(), 0644), 0);
    EXPECT_TRUE(sandbox.mayRead(token, font));
    // Through a supplementary group.
    ASSERT_EQ(::chmod(real.c_str(), 0640), 0);
    EXPECT_FALSE(sandbox.mayRead(token, font));
    ASSERT_EQ(::chown(real.c_str(), 0, 4711), 0);
    EXPECT_TRUE(sandbox.mayRead(token, font));
    // Behind a directory that it may not search.
    const auto directory = std::filesystem::path(real).parent_path();
    ASSERT_EQ(::chmod(directory.c_str(), 0700), 0);
    EXPECT_FALSE(sandbox.mayRead(token, font));
    // Root itself still may, on the same thread that has just been somebody else.
    ChildProcess root({"/bin/cat"});
    root.waitForEcho();
    EXPECT_TRUE(sandbox.mayRead(root.token(), font));
    ASSERT_EQ(::chmod(directory.c_str(), 0755), 0);
    EXPECT_TRUE(sandbox.mayRead(token, font));
}

TEST_F(LinuxSandboxTest, AskingLeavesTheDaemonAsItWas)
{
    const auto before = ownFileCredentials();
    BorrowedCredentials credentials;
    FileCredentials asked;
    const bool isAllowed =
        credentials.ask({otherUser, otherUser, {7}, 0}, [&asked] { asked = ownFileCredentials(); });
    EXPECT_EQ(isAllowed, ::geteuid() == 0);
    if (isAllowed) {
        EXPECT_EQ(asked, (FileCredentials{otherUser, otherUser, {7}, 0}));
    }
    EXPECT_EQ(ownFileCredentials(), before);
    EXPECT_EQ(::prctl(PR_GET_DUMPABLE), 1);
}

TEST_F(LinuxSandboxTest, ManyMayAskAtOnce)
{
    BorrowedCredentials credentials;
    const auto own = ownFileCredentials();
    const FileCredentials asked =
        ::geteuid() == 0 ? FileCredentials{otherUser, otherUser, {}, 0} : ownFileCredentials();
    std::atomic<int> right = 0;
    std::vector<std::thread> threads;
    for (int number = 0; number < 8; ++number) {
        threads.emplace_back([&, number] {
            for (int time = 0; time < 50; ++time) {
                const auto& wanted = (number + time) % 2 == 0 ? asked : own;
                credentials.ask(wanted, [&] { right += ownFileCredentials() == wanted ? 1 : 0; });
            }
        });
    }
    for (auto& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(right, 400);
}

TEST_F(LinuxSandboxTest, ExtensionsAreForTheProgramThatAsked)
{
    folder.write(font, "font");
    ChildProcess child({"/bin/sh", "-c", "echo 1; read a; exec /bin/cat"});
    ASSERT_EQ(child.read(), "1\n");
    const auto first = child.token();
    const auto extension = sandbox.issueReadExtension(first, font);
    ASSERT_TRUE(extension);
    EXPECT_EQ(tokens.check(*extension, first, font), ExtensionTokens::Verdict::granted);
    child.write("\n");
    child.waitForEcho();
    EXPECT_EQ(sandbox.issueReadExtension(first, font), std::nullopt);
    EXPECT_EQ(tokens.check(*extension, child.token(), font), ExtensionTokens::Verdict::refused);
    EXPECT_EQ(sandbox.issueReadExtension(child.token(), "/etc/passwd"), std::nullopt);
}

}  // namespace
}  // namespace typhon
