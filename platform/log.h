#pragma once

#include <string_view>

namespace typhon {

enum class LogLevel { debug, defaultLevel, error };

/// The daemon's own log facility, and the plain system log.
enum class LogSink { daemon, system };

/// Where messages go. Any thread. Control characters in a message are made visible, so that one message is
/// one line; an overlong message is cut, and says so.
class Log {
public:
    virtual ~Log() = default;
    virtual void write(LogSink sink, LogLevel level, std::string_view message) = 0;
};

inline void TYLog(Log& log, std::string_view message)
{
    log.write(LogSink::daemon, LogLevel::defaultLevel, message);
}
inline void TYLog_Debug(Log& log, std::string_view message)
{
    log.write(LogSink::daemon, LogLevel::debug, message);
}
inline void TYLog_Error(Log& log, std::string_view message)
{
    log.write(LogSink::daemon, LogLevel::error, message);
}
inline void systemLog(Log& log, std::string_view message)
{
    log.write(LogSink::system, LogLevel::defaultLevel, message);
}

}  // namespace typhon
