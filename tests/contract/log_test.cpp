#include "platform/linux/file_descriptor.h"
#include "platform/linux/linux_log.h"
#include "platform/simulated/simulated_log.h"

#include <functional>
#include <memory>
#include <optional>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {
namespace {

/// One log, and what arrived in it.
class Subject {
public:
    virtual ~Subject() = default;
    virtual Log& log() = 0;
    virtual std::vector<SimulatedLog::Entry> entries() = 0;
};

class SimulatedSubject final : public Subject {
public:
    Log& log() override { return log_; }
    std::vector<SimulatedLog::Entry> entries() override { return log_.entries(); }

private:
    SimulatedLog log_;
};

/// Reads the lines back.
class LinuxSubject final : public Subject {
public:
    Log& log() override { return log_; }
    std::vector<SimulatedLog::Entry> entries() override
    {
        struct stat status {};
        EXPECT_EQ(::fstat(file_.get(), &status), 0);
        std::string text(static_cast<std::size_t>(status.st_size), '\0');
        EXPECT_EQ(::pread(file_.get(), text.data(), text.size(), 0), status.st_size);
        std::vector<SimulatedLog::Entry> entries;
        std::istringstream lines(text);
        for (std::string level, sink; lines >> level >> sink;) {
            std::string message;
            lines.ignore(1);
            std::getline(lines, message);
            entries.push_back({sink == "[system]" ? LogSink::system : LogSink::daemon,
                               logLevelFromName(level).value(), message});
        }
        return entries;
    }

private:
    FileDescriptor file_{::memfd_create("log", MFD_CLOEXEC)};
    LinuxLog log_{LogLevel::debug, LinuxLog::Destination::descriptor, file_.get()};
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class LogContract : public testing::TestWithParam<Implementation> {
protected:
    const std::unique_ptr<Subject> subject = GetParam().make();
};

TEST_P(LogContract, MessagesArriveInOrderWithSinkLevelAndText)
{
    TYLog(subject->log(), "resolved.  This call");
    TYLog_Debug(subject->log(), "");
    TYLog_Error(subject->log(), "error reading /var/mobile/Library/UserFonts/UserFonts.plist");
    systemLog(subject->log(), "This process is not allowed to enumerate fonts - com.example.\xC3\xA9");
    const std::vector<SimulatedLog::Entry> expected{
        {LogSink::daemon, LogLevel::defaultLevel, "resolved.  This call"},
        {LogSink::daemon, LogLevel::debug, ""},
        {LogSink::daemon, LogLevel::error, "error reading /var/mobile/Library/UserFonts/UserFonts.plist"},
        {LogSink::system, LogLevel::defaultLevel,
         "This process is not allowed to enumerate fonts - com.example.\xC3\xA9"}};
    EXPECT_EQ(subject->entries(), expected);
}

TEST_P(LogContract, OneMessageIsOneEntryWhateverItHolds)
{
    TYLog(subject->log(), "a\nerror [daemon] b\r\n\n");
    TYLog(subject->log(), "c");
    const auto entries = subject->entries();
    ASSERT_EQ(entries.size(), 2u);
    EXPECT_EQ(entries[0].level, LogLevel::defaultLevel);
    EXPECT_EQ(entries[1].message, "c");
}

INSTANTIATE_TEST_SUITE_P(, LogContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
