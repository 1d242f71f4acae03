#include "platform/linux/desktop_entry.h"

#include <cstddef>

namespace typhon {

namespace {

constexpr std::string_view blanks = " \t\r";

std::string_view trimmed(std::string_view text)
{
    const auto start = text.find_first_not_of(blanks);
    if (start == std::string_view::npos) {
        return {};
    }
    return text.substr(start, text.find_last_not_of(blanks) - start + 1);
}

/// Takes the next line off `text`, trimmed.
std::string_view nextLine(std::string_view& text)
{
    const auto end = text.find('\n');
    const auto line = text.substr(0, end);
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    return trimmed(line);
}

bool isIgnored(std::string_view line)
{
    return line.empty() || line.starts_with('#');
}

/// The values of the keys that matter; of a repeated key, the first.
struct Keys {
    std::optional<std::string_view> type;
    std::optional<std::string_view> hidden;
    std::optional<std::string_view> placeholder;

    void take(std::string_view line)
    {
        const auto equals = line.find('=');
        if (equals == std::string_view::npos) {
            return;
        }
        const auto key = trimmed(line.substr(0, equals));
        auto* const wanted = key == "Type"                   ? &type
                             : key == "Hidden"               ? &hidden
                             : key == "X-Typhon-Placeholder" ? &placeholder
                                                             : nullptr;
        if (wanted != nullptr && !*wanted) {
            *wanted = trimmed(line.substr(equals + 1));
        }
    }
};

}  // namespace

std::optional<DesktopEntry> parseDesktopEntry(std::string_view text)
{
    std::string_view line;
    while (!text.empty() && isIgnored(line)) {
        line = nextLine(text);
    }
    if (line != "[Desktop Entry]") {
        return std::nullopt;
    }
    Keys keys;
    while (!text.empty()) {
        line = nextLine(text);
        if (line.starts_with('[')) {
            break;
        }
        if (!isIgnored(line)) {
            keys.take(line);
        }
    }
    if (keys.type != "Application" || keys.hidden == "true") {
        return std::nullopt;
    }
    return DesktopEntry{.isPlaceholder = keys.placeholder == "true"};
}

}  // namespace typhon
