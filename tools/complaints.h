#pragma once

#include "platform/log.h"

#include <mutex>
#include <string>
#include <vector>

namespace typhon {

/// Collects what a service complains of, for a program that reports it itself. Any thread.
class Complaints : public Log {
public:
    void write(LogSink, LogLevel level, std::string_view message) override
    {
        const std::lock_guard lock(mutex_);
        if (level == LogLevel::error) {
            messages_.emplace_back(message);
        }
    }
    /// The errors so far, one after another, or empty.
    std::string text() const
    {
        const std::lock_guard lock(mutex_);
        std::string text;
        for (const auto& message : messages_) {
            text += (text.empty() ? "" : "; ") + message;
        }
        return text;
    }

private:
    mutable std::mutex mutex_;
    std::vector<std::string> messages_;
};

}  // namespace typhon
