#include "platform/linux/audit_tokens.h"
#include "platform/linux/process_inspection.h"
#include "testing/child_process.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/auxv.h>
#include <sys/socket.h>

namespace typhon {
namespace {

using testing::ChildProcess;

TEST(AuditTokens, NameTheProcessAtTheOtherEnd)
{
    ChildProcess child(testing::remain);
    EXPECT_EQ(child.read(), "r");
    const auto token = child.token();
    EXPECT_EQ(token.processIdentifier, child.pid());
    EXPECT_EQ(token.effectiveUser, ::geteuid());
    EXPECT_NE(token.processInstance, 0u);
    EXPECT_NE(token.execGeneration, 0u);
    EXPECT_NE(token.bootEpoch, 0u);
    EXPECT_TRUE(isSameProcess(token));
    EXPECT_EQ(child.token(), token);
}

TEST(AuditTokens, OfAPeerAreThoseOfWhoMadeTheSocket)
{
    // A socket pair's peer is whoever made the pair: this process.
    int ends[2];
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    const FileDescriptor first(ends[0]);
    const FileDescriptor second(ends[1]);
    const auto token = tokenOfPeer(first.get());
    EXPECT_EQ(token.processIdentifier, ::getpid());
    const auto self = openPidfd(::getpid());
    EXPECT_EQ(token, tokenOfProcess(self.get()));
}

TEST(AuditTokens, AreAllZeroForWhatIsNoPeer)
{
    const FileDescriptor file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    EXPECT_EQ(tokenOfPeer(file.get()), AuditToken{});
    EXPECT_EQ(tokenOfPeer(-1), AuditToken{});
    EXPECT_EQ(tokenOfProcess(file.get()), AuditToken{});
    EXPECT_EQ(tokenOfProcess(-1), AuditToken{});
}

TEST(AuditTokens, AreAllZeroOnceTheProcessIsGone)
{
    ChildProcess child(testing::remain);
    EXPECT_EQ(child.read(), "r");
    const FileDescriptor pidfd(::fcntl(child.pidfd(), F_DUPFD_CLOEXEC, 3));
    child.end();
    EXPECT_EQ(tokenOfProcess(pidfd.get()), AuditToken{});
}

TEST(AuditTokens, NameNobodyAfterAnExecOfTheSameProgram)
{
    ChildProcess child({"/bin/sh", "-c", "echo 1; read a; exec /bin/sh -c 'echo 2; read a'"});
    EXPECT_EQ(child.read(), "1\n");
    const auto first = child.token();
    EXPECT_TRUE(isSameProcess(first));
    child.write("\n");
    EXPECT_EQ(child.read(), "2\n");
    const auto second = child.token();
    EXPECT_FALSE(isSameProcess(first));
    EXPECT_TRUE(isSameProcess(second));
    EXPECT_EQ(first.processInstance, second.processInstance);
    EXPECT_NE(first.execGeneration, second.execGeneration);
}

TEST(AuditTokens, NameNobodyWhenTheProcessHasExited)
{
    ChildProcess child(testing::remain);
    EXPECT_EQ(child.read(), "r");
    const auto token = child.token();
    child.end();
    EXPECT_FALSE(isSameProcess(token));
    EXPECT_FALSE(ProcessInspection::begin(token));
}

TEST(AuditTokens, NameNobodyWhenTheProcessIsAZombie)
{
    ChildProcess child([](int stream) {
        char byte = 0;
        [[maybe_unused]] const auto length = ::read(stream, &byte, 1);
    });
    const auto token = child.token();
    ASSERT_TRUE(isSameProcess(token));
    child.write("x");
    ASSERT_TRUE(testing::waitReadable(child.pidfd()));
    EXPECT_FALSE(isSameProcess(token));
}

TEST(AuditTokens, DifferBetweenProcesses)
{
    ChildProcess one(testing::remain);
    ChildProcess other(testing::remain);
    EXPECT_EQ(one.read() + other.read(), "rr");
    EXPECT_NE(one.token().processInstance, other.token().processInstance);
}

TEST(AuditTokens, NameNobodyWithAnyFieldChanged)
{
    ChildProcess child(testing::remain);
    EXPECT_EQ(child.read(), "r");
    const auto token = child.token();
    ASSERT_TRUE(isSameProcess(token));
    auto changed = token;
    changed.processIdentifier = ::getpid();
    EXPECT_FALSE(isSameProcess(changed));
    changed = token;
    ++changed.processInstance;
    EXPECT_FALSE(isSameProcess(changed));
    changed = token;
    ++changed.execGeneration;
    EXPECT_FALSE(isSameProcess(changed));
    changed = token;
    ++changed.bootEpoch;
    EXPECT_FALSE(isSameProcess(changed));
    EXPECT_FALSE(isSameProcess(AuditToken{}));
}

TEST(AuditTokens, WithoutAnExecGenerationNameNobody)
{
    ChildProcess child(testing::remain);
    EXPECT_EQ(child.read(), "r");
    auto token = child.token();
    token.execGeneration = 0;
    EXPECT_FALSE(isSameProcess(token));
}

TEST(AuditTokens, AChangeOfTheRandomBytesIsAChangeOfTheProgram)
{
    ChildProcess child([](int stream) {
        char byte = 'r';
        [[maybe_unused]] auto length = ::write(stream, &byte, 1);
        length = ::read(stream, &byte, 1);
        auto* random = reinterpret_cast<volatile unsigned char*>(::getauxval(AT_RANDOM));
        *random = static_cast<unsigned char>(*random ^ 1u);
        testing::remain(stream);
    });
    EXPECT_EQ(child.read(), "r");
    const auto token = child.token();
    child.write("x");
    EXPECT_EQ(child.read(), "r");
    EXPECT_FALSE(isSameProcess(token));
}

TEST(AuditTokens, WhatIsNoPidfdIsToldFromOne)
{
    const auto self = openPidfd(::getpid());
    EXPECT_TRUE(isPidfd(self.get()));
    const FileDescriptor file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    EXPECT_FALSE(isPidfd(file.get()));
    EXPECT_FALSE(isPidfd(-1));
}

}  // namespace
}  // namespace typhon
