#include "platform/linux/file_descriptor.h"
#include "platform/linux/linux_log.h"

#include <array>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

class LinuxLogTest : public testing::Test {
protected:
    std::string written() const
    {
        std::string text;
        std::array<char, 4096> block;
        off_t offset = 0;
        for (ssize_t count = 0; (count = ::pread(file.get(), block.data(), block.size(), offset)) > 0;) {
            text.append(block.data(), static_cast<std::size_t>(count));
            offset += count;
        }
        return text;
    }
    LinuxLog logOf(LogLevel minimum) const
    {
        return LinuxLog(minimum, LinuxLog::Destination::descriptor, file.get());
    }

    FileDescriptor file{::memfd_create("log", MFD_CLOEXEC)};
};

TEST_F(LinuxLogTest, WritesLevelSinkAndMessage)
{
    auto log = logOf(LogLevel::debug);
    TYLog_Debug(log, "looking");
    TYLog(log, "resolved.  This call");
    TYLog_Error(log, "error reading /var");
    systemLog(log, "This process is not allowed");
    EXPECT_EQ(written(), "debug [daemon] looking\n"
                         "default [daemon] resolved.  This call\n"
                         "error [daemon] error reading /var\n"
                         "default [system] This process is not allowed\n");
}

TEST_F(LinuxLogTest, DropsWhatIsBelowTheMinimum)
{
    auto log = logOf(LogLevel::error);
    TYLog_Debug(log, "no");
    TYLog(log, "no");
    TYLog_Error(log, "yes");
    EXPECT_EQ(written(), "error [daemon] yes\n");
}

TEST_F(LinuxLogTest, AMessageCannotStartALineOfItsOwn)
{
    auto log = logOf(LogLevel::debug);
    TYLog(log, "a\nerror [daemon] forged");
    EXPECT_EQ(written(), "default [daemon] a\\nerror [daemon] forged\n");
}

TEST_F(LinuxLogTest, CutsAnOverlongMessageAndSaysSo)
{
    auto log = logOf(LogLevel::debug);
    TYLog(log, std::string(1'000'000, 'x'));
    const auto text = written();
    EXPECT_LT(text.size(), 9'000u);
    EXPECT_THAT(text, HasSubstr("x... [991808 bytes more]\n"));
}

TEST_F(LinuxLogTest, LinesOfSeveralThreadsDoNotMix)
{
    auto log = logOf(LogLevel::debug);
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < 4; ++thread) {
        threads.emplace_back([&, thread] {
            for (int n = 0; n < 50; ++n) {
                TYLog(log, std::string(500, static_cast<char>('a' + thread)));
            }
        });
    }
    threads.clear();
    const auto text = written();
    const std::size_t line = std::string("default [daemon] \n").size() + 500;
    ASSERT_EQ(text.size(), 200 * line);
    for (std::size_t start = 0; start < text.size(); start += line) {
        const auto message = text.substr(start + line - 501, 500);
        EXPECT_EQ(message, std::string(500, message[0]));
        EXPECT_EQ(text[start + line - 1], '\n');
    }
}

TEST(LinuxLogDestination, IsTheJournalOnlyWhenStandardErrorIsConnectedToIt)
{
    struct stat status {};
    ASSERT_EQ(::fstat(STDERR_FILENO, &status), 0);
    ::setenv("JOURNAL_STREAM", fmt::format("{}:{}", status.st_dev, status.st_ino).c_str(), 1);
    EXPECT_EQ(LinuxLog::usualDestination(), LinuxLog::Destination::journal);
    ::setenv("JOURNAL_STREAM", fmt::format("{}:{}", status.st_dev, status.st_ino + 1).c_str(), 1);
    EXPECT_EQ(LinuxLog::usualDestination(), LinuxLog::Destination::descriptor);
    ::unsetenv("JOURNAL_STREAM");
    EXPECT_EQ(LinuxLog::usualDestination(), LinuxLog::Destination::descriptor);
}

TEST(JournalFields, CarryTheMessageItsPriorityAndItsSink)
{
    EXPECT_THAT(
        journalFields(LogSink::daemon, LogLevel::error, "a\nPRIORITY=0"),
        ElementsAre("MESSAGE=a\\nPRIORITY=0", "PRIORITY=3", "TYPHON_SINK=daemon", "TYPHON_LEVEL=error"));
    EXPECT_THAT(journalFields(LogSink::system, LogLevel::defaultLevel, "b"),
                ElementsAre("MESSAGE=b", "PRIORITY=5", "TYPHON_SINK=system", "TYPHON_LEVEL=default"));
    EXPECT_THAT(journalFields(LogSink::daemon, LogLevel::debug, "c"),
                ElementsAre("MESSAGE=c", "PRIORITY=7", "TYPHON_SINK=daemon", "TYPHON_LEVEL=debug"));
}

TEST(LogLevelFromName, KnowsThreeNames)
{
    EXPECT_EQ(logLevelFromName("debug"), LogLevel::debug);
    EXPECT_EQ(logLevelFromName("default"), LogLevel::defaultLevel);
    EXPECT_EQ(logLevelFromName("error"), LogLevel::error);
    EXPECT_EQ(logLevelFromName("Error"), std::nullopt);
}

}  // namespace
}  // namespace typhon
