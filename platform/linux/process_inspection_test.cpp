#include "platform/linux/confinement.h"
#include "platform/linux/process_inspection.h"
#include "testing/child_process.h"

#include <gtest/gtest.h>
#include <sched.h>

// What looks at a process keep: the process itself, from look to look; what was seen of it, for one message.

namespace typhon {
namespace {

using testing::ChildProcess;

/// Says "r", and once it is told to, takes on a user namespace and says so again.
void confineOnDemand(int stream)
{
    char byte = 'r';
    [[maybe_unused]] auto length = ::write(stream, &byte, 1);
    length = ::read(stream, &byte, 1);
    if (::unshare(CLONE_NEWUSER) == 0) {
        testing::remain(stream);
    }
}

std::optional<bool> isSandboxed(const AuditToken& token)
{
    const ConfinementProbe probe;
    return inspectProcess(token, [&](const ProcessInspection& process) {
        return std::optional(probe.look(process).isSandboxed);
    });
}

/// What becomes of the first question of a message.
void lookAtSender(const AuditToken& token)
{
    const MessageLooks message;
    ASSERT_TRUE(isSameProcess(token));
}

TEST(ProcessInspection, HoldsAProcessFromOneLookToTheNext)
{
    ChildProcess child(testing::remain);
    ASSERT_EQ(child.read(), "r");
    const auto token = child.token();
    lookAtSender(token);
    const auto held = holdProcess(token);
    ASSERT_TRUE(held);
    EXPECT_EQ(holdProcess(token), held);
    releaseProcess(token);
    EXPECT_NE(holdProcess(token), held);
}

TEST(ProcessInspection, HoldsNothingOfAProcessThatSentNothing)
{
    ChildProcess child(testing::remain);
    ASSERT_EQ(child.read(), "r");
    ASSERT_TRUE(isSameProcess(child.token()));
    EXPECT_NE(holdProcess(child.token()), holdProcess(child.token()));
}

TEST(ProcessInspection, HoldsNothingOfAProcessThatWasNotConfirmed)
{
    ChildProcess child(testing::remain);
    ASSERT_EQ(child.read(), "r");
    auto token = child.token();
    ++token.execGeneration;
    const MessageLooks message;
    ASSERT_FALSE(isSameProcess(token));
    EXPECT_NE(holdProcess(token), holdProcess(token));
}

TEST(ProcessInspection, AHeldProcessThatHasEndedIsNobody)
{
    ChildProcess child(testing::remain);
    ASSERT_EQ(child.read(), "r");
    const auto token = child.token();
    lookAtSender(token);
    child.end();
    EXPECT_FALSE(isSameProcess(token));
    EXPECT_EQ(isSandboxed(token), std::nullopt);
}

TEST(ProcessInspection, AHeldProcessIsNobodyAfterAnExec)
{
    ChildProcess child({"/bin/sh", "-c", "echo 1; read a; exec /bin/sh -c 'echo 2; read a'"});
    ASSERT_EQ(child.read(), "1\n");
    const auto token = child.token();
    lookAtSender(token);
    child.write("\n");
    ASSERT_EQ(child.read(), "2\n");
    EXPECT_EQ(isSandboxed(token), std::nullopt);
}

TEST(ProcessInspection, AHeldProcessIsNobodyAfterAnExecThoughAChildKeepsItsMemory)
{
    ChildProcess child([](int stream) {
        static std::array<char, 64 * 1024> stack;
        const auto idle = [](void*) -> int {
            for (;;) {
                ::pause();
            }
        };
        ::clone(idle, stack.data() + stack.size(), CLONE_VM, nullptr);
        char byte = 'r';
        [[maybe_unused]] auto length = ::write(stream, &byte, 1);
        length = ::read(stream, &byte, 1);
        ::dup2(stream, 0);
        ::dup2(stream, 1);
        ChildProcess::exec({"/bin/cat"});
    });
    ASSERT_EQ(child.read(), "r");
    const auto token = child.token();
    lookAtSender(token);
    const auto keeper = ChildProcess::firstChildOf(child.pid());
    ASSERT_GT(keeper, 0);
    child.write("x");
    child.waitForEcho();
    EXPECT_FALSE(isSameProcess(token));
    EXPECT_TRUE(isSameProcess(child.token()));
    ::kill(keeper, SIGKILL);
}

TEST(ProcessInspection, WhileOneMessageIsHandledAProcessIsSeenAsItWasAtFirst)
{
    ChildProcess child(confineOnDemand);
    ASSERT_EQ(child.read(), "r");
    const auto token = child.token();
    {
        const MessageLooks message;
        EXPECT_EQ(isSandboxed(token), false);
        child.write("x");
        ASSERT_EQ(child.read(), "r");
        EXPECT_EQ(isSandboxed(token), false);
    }
    const MessageLooks next;
    EXPECT_EQ(isSandboxed(token), true);
}

TEST(ProcessInspection, LooksOfDifferentProcessesShareNothing)
{
    ChildProcess child(confineOnDemand);
    ASSERT_EQ(child.read(), "r");
    const ChildProcess other(testing::remain);
    ASSERT_EQ(other.read(), "r");
    const auto token = child.token();
    const MessageLooks message;
    EXPECT_EQ(isSandboxed(other.token()), false);
    EXPECT_EQ(isSandboxed(token), false);
    child.write("x");
    ASSERT_EQ(child.read(), "r");
    EXPECT_EQ(isSandboxed(token), true);
}

TEST(ProcessInspection, AnExecInTheMiddleOfAMessageIsNoticedByTheNextLook)
{
    ChildProcess child({"/bin/sh", "-c", "echo 1; read a; exec /bin/sh -c 'echo 2; read a'"});
    ASSERT_EQ(child.read(), "1\n");
    const auto token = child.token();
    const MessageLooks message;
    ASSERT_EQ(isSandboxed(token), false);
    child.write("\n");
    ASSERT_EQ(child.read(), "2\n");
    // Intended: nothing is read for these questions, so the earlier look of the same message answers them.
    EXPECT_TRUE(isSameProcess(token));
    EXPECT_EQ(isSandboxed(token), false);
    const auto readAgain =
        inspectProcess(token, [](const ProcessInspection& process) { return process.contents("comm", 100); });
    EXPECT_EQ(readAgain, std::nullopt);
    EXPECT_FALSE(isSameProcess(token));
}

TEST(ProcessInspection, WhatALookHasReadAndNotConfirmedIsConfirmedByTheNext)
{
    ChildProcess child({"/bin/sh", "-c", "echo 1; read a; exec /bin/sh -c 'echo 2; read a'"});
    ASSERT_EQ(child.read(), "1\n");
    const auto token = child.token();
    const MessageLooks message;
    ASSERT_TRUE(isSameProcess(token));
    child.write("\n");
    ASSERT_EQ(child.read(), "2\n");
    {
        const auto abandoned = ProcessInspection::begin(token);
        ASSERT_TRUE(abandoned && abandoned->status());
    }
    EXPECT_FALSE(isSameProcess(token));
}

TEST(ProcessInspection, TheRootIsThatOfTheFirstLookOfAMessage)
{
    const ChildProcess child(testing::remain);
    ASSERT_EQ(child.read(), "r");
    const auto rootSeen = [&] {
        return inspectProcess(child.token(),
                              [](const ProcessInspection& process) { return std::optional(process.root()); });
    };
    const MessageLooks message;
    const auto first = rootSeen();
    ASSERT_TRUE(first && **first);
    EXPECT_EQ(rootSeen(), first);
    const MessageLooks next;
    EXPECT_NE(rootSeen(), first);
}

TEST(ProcessInspection, AMessageWithinAMessageHasLooksOfItsOwn)
{
    ChildProcess child(confineOnDemand);
    ASSERT_EQ(child.read(), "r");
    const auto token = child.token();
    const MessageLooks outer;
    ASSERT_EQ(isSandboxed(token), false);
    child.write("x");
    ASSERT_EQ(child.read(), "r");
    {
        const MessageLooks inner;
        EXPECT_EQ(isSandboxed(token), true);
    }
    EXPECT_EQ(isSandboxed(token), false);
}

}  // namespace
}  // namespace typhon
