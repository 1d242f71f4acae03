#include "platform/linux/confinement.h"
#include "testing/child_process.h"

#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sched.h>
#include <sys/prctl.h>

namespace typhon {
namespace {

using testing::ChildProcess;

Confinement lookAt(const ChildProcess& child)
{
    const ConfinementProbe probe;
    return inspectProcess(
               child.token(),
               [&](const ProcessInspection& process) { return std::optional(probe.look(process)); })
        .value();
}

/// cat inside bubblewrap. The child is bubblewrap itself; what it starts is another process.
std::vector<std::string> inSandbox(std::vector<std::string> options)
{
    options.insert(options.begin(), {"bwrap", "--ro-bind", "/", "/", "--die-with-parent"});
    return options;
}

Confinement lookInside(const ChildProcess& child)
{
    const ConfinementProbe probe;
    return inspectProcess(
               child.tokenInside(),
               [&](const ProcessInspection& process) { return std::optional(probe.look(process)); })
        .value();
}

TEST(Confinement, OfAnOrdinaryChildIsNone)
{
    ChildProcess child({"/bin/cat"});
    child.waitForEcho();
    const auto seen = lookAt(child);
    EXPECT_FALSE(seen.isSandboxed);
    EXPECT_FALSE(seen.hasOwnProcessNamespace);
    EXPECT_FALSE(seen.hasOwnUserNamespace);
}

TEST(Confinement, SeesASandboxWithTheSameFiles)
{
    ChildProcess child(inSandbox({"/bin/cat"}));
    child.waitForEcho();
    const auto seen = lookInside(child);
    EXPECT_TRUE(seen.isSandboxed);
    EXPECT_FALSE(seen.hasOwnProcessNamespace);
}

TEST(Confinement, SeesAProcessNamespace)
{
    ChildProcess child(inSandbox({"--unshare-pid", "--unshare-user", "/bin/cat"}));
    child.waitForEcho();
    const auto seen = lookInside(child);
    EXPECT_TRUE(seen.isSandboxed);
    EXPECT_TRUE(seen.hasOwnProcessNamespace);
    EXPECT_TRUE(seen.hasOwnUserNamespace);
}

TEST(Confinement, SeesAUserNamespaceAlone)
{
    ChildProcess child([](int stream) {
        if (::unshare(CLONE_NEWUSER) == 0) {
            testing::remain(stream);
        }
    });
    ASSERT_EQ(child.read(), "r");
    const auto seen = lookAt(child);
    EXPECT_TRUE(seen.isSandboxed);
    EXPECT_TRUE(seen.hasOwnUserNamespace);
    EXPECT_FALSE(seen.hasOwnProcessNamespace);
}

TEST(Confinement, SeesAnotherRootDirectory)
{
    ChildProcess child([](int stream) {
        // In a user namespace of its own an ordinary user may do this as well.
        if ((::geteuid() == 0 || ::unshare(CLONE_NEWUSER) == 0) && ::chroot("/usr") == 0) {
            testing::remain(stream);
        }
    });
    ASSERT_EQ(child.read(), "r");
    EXPECT_TRUE(lookAt(child).isSandboxed);
}

bool takeOnSystemCallFilter()
{
    sock_filter allow[] = {{BPF_RET | BPF_K, 0, 0, SECCOMP_RET_ALLOW}};
    const sock_fprog program{1, allow};
    return ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
           ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

TEST(Confinement, SeesASystemCallFilter)
{
    ChildProcess child([](int stream) {
        if (takeOnSystemCallFilter()) {
            testing::remain(stream);
        }
    });
    ASSERT_EQ(child.read(), "r");
    const auto seen = lookAt(child);
    EXPECT_TRUE(seen.isSandboxed);
    EXPECT_FALSE(seen.hasOwnUserNamespace);
}

/// Takes it on when told to, in the midst of its life.
void expectToBeSeenOnceTakenOn(bool (*takeOn)())
{
    ChildProcess child([takeOn](int stream) {
        char byte = 'r';
        [[maybe_unused]] auto length = ::write(stream, &byte, 1);
        length = ::read(stream, &byte, 1);
        if (takeOn()) {
            testing::remain(stream);
        }
    });
    ASSERT_EQ(child.read(), "r");
    EXPECT_FALSE(lookAt(child).isSandboxed);
    child.write("x");
    ASSERT_EQ(child.read(), "r");
    EXPECT_TRUE(lookAt(child).isSandboxed);
}

TEST(Confinement, IsSeenFromTheMomentAProcessEntersANamespace)
{
    expectToBeSeenOnceTakenOn([] { return ::unshare(CLONE_NEWUSER) == 0; });
}

TEST(Confinement, IsSeenFromTheMomentAProcessTakesOnASystemCallFilter)
{
    expectToBeSeenOnceTakenOn(takeOnSystemCallFilter);
}

}  // namespace
}  // namespace typhon
