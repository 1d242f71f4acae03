#include "platform/simulated/simulated_log.h"

#include <algorithm>

namespace typhon {

std::size_t SimulatedLog::count(LogSink sink, LogLevel level, std::string_view message) const
{
    return static_cast<std::size_t>(std::ranges::count(entries_, Entry{sink, level, std::string(message)}));
}

std::size_t SimulatedLog::countContaining(std::string_view part) const
{
    return static_cast<std::size_t>(std::ranges::count_if(
        entries_, [&](const Entry& entry) { return entry.message.find(part) != std::string::npos; }));
}

std::string SimulatedLog::text(LogLevel minimum) const
{
    std::string lines;
    for (const auto& entry : entries_) {
        if (entry.level >= minimum) {
            lines += entry.message;
            lines += '\n';
        }
    }
    return lines;
}

}  // namespace typhon
