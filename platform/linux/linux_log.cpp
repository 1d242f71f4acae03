#include "platform/linux/linux_log.h"

#include "platform/linux/visible_text.h"

#include <array>
#include <cerrno>
#include <cstdlib>

#include <fmt/format.h>
#include <sys/stat.h>
#include <sys/uio.h>
// Every message would carry the same place in this file.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

// One message is one line and one write, so that the lines of several threads and processes do not mix. The
// message comes from clients in part: it cannot start a line of its own, colour the terminal or fill the
// disk.

namespace typhon {

namespace {

constexpr std::size_t longestMessage = 8 * 1024;

/// As syslog numbers them: error, notice, debug.
int priorityOf(LogLevel level)
{
    switch (level) {
    case LogLevel::debug:
        return 7;
    case LogLevel::defaultLevel:
        return 5;
    case LogLevel::error:
        break;
    }
    return 3;
}

void writeToJournal(const std::vector<std::string>& fields)
{
    std::vector<iovec> vectors;
    vectors.reserve(fields.size());
    for (const auto& field : fields) {
        vectors.push_back({.iov_base = const_cast<char*>(field.data()), .iov_len = field.size()});
    }
    sd_journal_sendv(vectors.data(), static_cast<int>(vectors.size()));
}

void writeLine(int descriptor, std::string_view line)
{
    while (!line.empty()) {
        const auto count = ::write(descriptor, line.data(), line.size());
        if (count < 0 && errno != EINTR) {
            return;
        }
        line.remove_prefix(count < 0 ? 0 : static_cast<std::size_t>(count));
    }
}

}  // namespace

LinuxLog::Destination LinuxLog::usualDestination()
{
    const char* stream = std::getenv("JOURNAL_STREAM");
    struct stat status {};
    if (stream == nullptr || ::fstat(STDERR_FILENO, &status) != 0) {
        return Destination::descriptor;
    }
    // The variable is inherited also by programs whose standard error was redirected since.
    return stream == fmt::format("{}:{}", status.st_dev, status.st_ino) ? Destination::journal
                                                                        : Destination::descriptor;
}

LinuxLog::LinuxLog(LogLevel minimum, Destination destination, int descriptor)
    : minimum_(minimum), destination_(destination), descriptor_(descriptor)
{}

void LinuxLog::write(LogSink sink, LogLevel level, std::string_view message)
{
    if (level < minimum_) {
        return;
    }
    if (destination_ == Destination::journal) {
        writeToJournal(journalFields(sink, level, message));
        return;
    }
    const auto line =
        fmt::format("{} [{}] {}\n", nameOf(level), nameOf(sink), visibleText(message, longestMessage));
    const std::lock_guard lock(writing_);
    writeLine(descriptor_, line);
}

const char* nameOf(LogLevel level)
{
    switch (level) {
    case LogLevel::debug:
        return "debug";
    case LogLevel::defaultLevel:
        return "default";
    case LogLevel::error:
        break;
    }
    return "error";
}

const char* nameOf(LogSink sink)
{
    return sink == LogSink::daemon ? "daemon" : "system";
}

std::optional<LogLevel> logLevelFromName(std::string_view name)
{
    for (const auto level : {LogLevel::debug, LogLevel::defaultLevel, LogLevel::error}) {
        if (name == nameOf(level)) {
            return level;
        }
    }
    return std::nullopt;
}

std::vector<std::string> journalFields(LogSink sink, LogLevel level, std::string_view message)
{
    return {"MESSAGE=" + visibleText(message, longestMessage), fmt::format("PRIORITY={}", priorityOf(level)),
            fmt::format("TYPHON_SINK={}", nameOf(sink)), fmt::format("TYPHON_LEVEL={}", nameOf(level))};
}

}  // namespace typhon
