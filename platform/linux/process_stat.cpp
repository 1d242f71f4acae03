#include "platform/linux/process_stat.h"

#include <algorithm>
#include <charconv>

namespace typhon {

namespace {

/// Takes the next field off the text as a number; null when it is none.
std::optional<long long> nextNumber(std::string_view& text)
{
    text.remove_prefix(std::min(text.find_first_not_of(' '), text.size()));
    const auto field = text.substr(0, text.find(' '));
    long long value = 0;
    const auto [end, error] = std::from_chars(field.data(), field.data() + field.size(), value);
    if (error != std::errc() || end != field.data() + field.size()) {
        return std::nullopt;
    }
    text.remove_prefix(field.size());
    return value;
}

}  // namespace

std::optional<ProcessStat> processStatFrom(std::string_view text)
{
    // The name of the program stands in parentheses, and may hold any character but the last of them.
    const auto nameEnd = text.rfind(") ");
    if (nameEnd == std::string_view::npos || text.size() < nameEnd + 3) {
        return std::nullopt;
    }
    text.remove_prefix(nameEnd + 3);
    const auto parent = nextNumber(text);
    const auto group = parent ? nextNumber(text) : std::nullopt;
    const auto session = group ? nextNumber(text) : std::nullopt;
    const auto terminal = session ? nextNumber(text) : std::nullopt;
    const auto foreground = terminal ? nextNumber(text) : std::nullopt;
    if (!foreground) {
        return std::nullopt;
    }
    return ProcessStat{static_cast<pid_t>(*parent), static_cast<pid_t>(*group), static_cast<pid_t>(*session),
                       static_cast<std::uint32_t>(*terminal), static_cast<pid_t>(*foreground)};
}

}  // namespace typhon
