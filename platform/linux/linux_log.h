#pragma once

#include "platform/log.h"

#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <unistd.h>

namespace typhon {

/// Writes to the journal, with fields, or to a descriptor as lines `LEVEL [SINK] MESSAGE`. Messages longer
/// than 8 KiB are cut. A message that cannot be written is dropped.
class LinuxLog final : public Log {
public:
    enum class Destination { journal, descriptor };

    /// The journal when the service manager has connected standard error to it, else standard error.
    static Destination usualDestination();

    /// Drops messages below `minimum`. `descriptor` stays the caller's and outlives the log.
    explicit LinuxLog(LogLevel minimum, Destination destination = usualDestination(),
                      int descriptor = STDERR_FILENO);

    void write(LogSink sink, LogLevel level, std::string_view message) override;

private:
    const LogLevel minimum_;
    const Destination destination_;
    const int descriptor_;
    /// Not every file keeps concurrent writes of one process apart.
    std::mutex writing_;
};

/// `debug`, `default` or `error`; `daemon` or `system`.
const char* nameOf(LogLevel level);
const char* nameOf(LogSink sink);

/// The level of that name, or null.
std::optional<LogLevel> logLevelFromName(std::string_view name);

/// The fields of one message in the journal, each as `NAME=value`: MESSAGE, PRIORITY (3, 5 or 7), TYPHON_SINK
/// and TYPHON_LEVEL.
std::vector<std::string> journalFields(LogSink sink, LogLevel level, std::string_view message);

}  // namespace typhon
