#pragma once

#include "platform/log.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {

/// Keeps every message, letter for letter as it was given. One thread.
class SimulatedLog final : public Log {
public:
    struct Entry {
        LogSink sink;
        LogLevel level;
        std::string message;
        bool operator==(const Entry&) const = default;
    };

    void write(LogSink sink, LogLevel level, std::string_view message) override
    {
        entries_.push_back({sink, level, std::string(message)});
    }

    const std::vector<Entry>& entries() const { return entries_; }
    void clear() { entries_.clear(); }

    /// How often exactly this was written.
    std::size_t count(LogSink sink, LogLevel level, std::string_view message) const;
    /// How many messages contain `part`, whatever their sink and level.
    std::size_t countContaining(std::string_view part) const;
    bool contains(LogSink sink, LogLevel level, std::string_view message) const
    {
        return count(sink, level, message) != 0;
    }
    /// All messages of at least that level, one a line, for comparisons and failure texts.
    std::string text(LogLevel minimum = LogLevel::debug) const;

private:
    std::vector<Entry> entries_;
};

}  // namespace typhon
