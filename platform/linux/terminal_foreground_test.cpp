#include "platform/linux/process_stat.h"
#include "platform/linux/terminal_foreground.h"
#include "testing/child_process.h"
#include "testing/pseudo_terminal.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::ChildProcess;
using testing::PseudoTerminal;
using testing::remain;

TEST(ProcessStat, IsReadBehindAProgramNameOfAnyKind)
{
    const auto stat = processStatFrom("42 (a) R 1 (b) c) S 7 42 41 34816 43 4194304 1 2 3\n");
    ASSERT_TRUE(stat);
    EXPECT_EQ(stat->parent, 7);
    EXPECT_EQ(stat->group, 42);
    EXPECT_EQ(stat->session, 41);
    EXPECT_EQ(stat->terminal, 34816U);
    EXPECT_EQ(stat->foregroundGroup, 43);
}

TEST(ProcessStat, OfAnythingElseIsNone)
{
    for (const char* text :
         {"", ")", "1 (a)", "1 (a) S", "1 (a) S 1 2 3", "1 (a) S 1 2 x 4 5", "1 (a) S 1  "}) {
        EXPECT_FALSE(processStatFrom(text)) << text;
    }
}

TEST(TerminalOfDescriptor, TakesATerminalOpenedForReadingAndWriting)
{
    const PseudoTerminal terminal;
    const auto number = terminalOfDescriptor(terminal.theirs.get());
    ASSERT_TRUE(number);
    EXPECT_NE(terminalOfDescriptor(PseudoTerminal().theirs.get()), number);
}

TEST(TerminalOfDescriptor, RefusesWhatWasNotOpenedSoAndWhatIsNoTerminal)
{
    const PseudoTerminal terminal;
    const FileDescriptor readOnly(::open(terminal.path.c_str(), O_RDONLY | O_NOCTTY | O_CLOEXEC));
    const FileDescriptor unopened(::open(terminal.path.c_str(), O_PATH | O_CLOEXEC));
    const FileDescriptor null(::open("/dev/null", O_RDWR | O_CLOEXEC));
    for (const int descriptor : {readOnly.get(), unopened.get(), null.get(), -1}) {
        EXPECT_FALSE(terminalOfDescriptor(descriptor));
    }
}

struct ForegroundTest : ::testing::Test {
    ConfinementProbe probe;
    PseudoTerminal terminal;
    const std::optional<std::uint32_t> number = terminalOfDescriptor(terminal.theirs.get());

    /// Waits until the child says that it is where it should be.
    std::optional<std::uint32_t> foregroundOf(const ChildProcess& child)
    {
        EXPECT_EQ(child.read(), "r");
        return foregroundTerminalOf(child.token(), probe);
    }
};

TEST_F(ForegroundTest, TheForegroundGroupOfASessionStandsInItsTerminal)
{
    const ChildProcess leader([this](int stream) {
        terminal.becomeLeader();
        remain(stream);
    });
    EXPECT_EQ(foregroundOf(leader), number);
}

TEST_F(ForegroundTest, AProcessInTheBackgroundStandsNowhere)
{
    const ChildProcess background([this](int stream) {
        terminal.becomeLeader();
        if (::fork() == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            ::setpgid(0, 0);
            remain(stream);
        }
        // The leader's own group stays in the foreground.
        ::pause();
    });
    ASSERT_EQ(background.read(), "r");
    EXPECT_FALSE(foregroundTerminalOf(background.tokenInside(), probe));
    EXPECT_EQ(foregroundTerminalOf(background.token(), probe), number);
}

TEST_F(ForegroundTest, AProcessWithoutTerminalStandsNowhere)
{
    const ChildProcess child([](int stream) {
        ::setsid();
        remain(stream);
    });
    EXPECT_FALSE(foregroundOf(child));
}

TEST_F(ForegroundTest, AProcessThatIsGoneStandsNowhere)
{
    ChildProcess leader([this](int stream) {
        terminal.becomeLeader();
        remain(stream);
    });
    ASSERT_EQ(foregroundOf(leader), number);
    const auto token = leader.token();
    leader.end();
    EXPECT_FALSE(foregroundTerminalOf(token, probe));
}

std::vector<std::string> sandboxOf(const std::vector<std::string>& options)
{
    std::vector<std::string> command{
        "bwrap",         "--ro-bind",        "/", "/", "--dev", "/dev", "--proc", "/proc", "--unshare-user",
        "--unshare-pid", "--die-with-parent"};
    command.insert(command.end(), options.begin(), options.end());
    return command;
}

TEST_F(ForegroundTest, ASandboxWithASessionOfItsOwnStandsWhereItsLauncherDoes)
{
    const ChildProcess launcher([this](int stream) {
        terminal.becomeLeader();
        ::dup2(stream, 0);
        ::dup2(stream, 1);
        ChildProcess::exec(sandboxOf({"--new-session", "cat"}));
    });
    launcher.waitForEcho();
    EXPECT_EQ(foregroundTerminalOf(launcher.tokenInside(), probe), number);
}

TEST_F(ForegroundTest, ASandboxStartedInTheBackgroundStandsNowhere)
{
    const ChildProcess launcher([this](int stream) {
        terminal.becomeLeader();
        if (::fork() == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            ::setpgid(0, 0);
            ::dup2(stream, 0);
            ::dup2(stream, 1);
            ChildProcess::exec(sandboxOf({"--new-session", "cat"}));
        }
        ::pause();
    });
    launcher.waitForEcho();
    EXPECT_FALSE(foregroundTerminalOf(launcher.tokenInside(), probe));
}

TEST_F(ForegroundTest, ATerminalThatASandboxMadeItselfIsNone)
{
    // The session leader in there has a terminal whose number may be that of one outside.
    const ChildProcess launcher([](int stream) {
        ::setsid();
        ::dup2(stream, 0);
        ::dup2(stream, 1);
        ChildProcess::exec(sandboxOf({"python3", "-c", R"(import os, pty, sys
child, terminal = pty.fork()
if child == 0:
    os.execvp("sh", ["sh", "-c", "echo; read line"])
# It has its terminal, and is what it will be.
os.read(terminal, 1)
sys.stdin.read(1)
sys.stdout.write("x")
sys.stdout.flush()
os.waitpid(child, 0))"}));
    });
    launcher.waitForEcho();
    EXPECT_FALSE(foregroundTerminalOf(launcher.tokenInside(), probe));
}

}  // namespace
}  // namespace typhon
