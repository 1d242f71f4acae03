#include "platform/file_url.h"

#include <algorithm>

// URLs come from clients, so reading is strict: a text that two programs could read as two paths is no URL.

namespace typhon {

namespace {

constexpr std::string_view scheme = "file:";
constexpr std::string_view localHost = "localhost";
constexpr std::string_view hexadecimalDigits = "0123456789ABCDEF";

char lowered(char c)
{
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

bool startsWithIgnoringCase(std::string_view text, std::string_view start)
{
    return text.size() >= start.size() && std::equal(start.begin(), start.end(), text.begin(),
                                                     [](char a, char b) { return a == lowered(b); });
}

/// Whether a character may stand unencoded in the path of a URL.
bool standsForItself(char c)
{
    const char letter = lowered(c);
    return (letter >= 'a' && letter <= 'z') || (c >= '0' && c <= '9') ||
           (c != '\0' && std::string_view("-._~/!$&'()*+,;=:@").find(c) != std::string_view::npos);
}

int digit(char c)
{
    const auto upper = c >= 'a' && c <= 'f' ? static_cast<char>(c - 'a' + 'A') : c;
    const auto found = hexadecimalDigits.find(upper);
    return found == std::string_view::npos ? -1 : static_cast<int>(found);
}

/// The character behind the "%XX" that `text` starts with, or null.
std::optional<char> unescaped(std::string_view text)
{
    const int high = text.size() < 3 ? -1 : digit(text[1]);
    const int low = text.size() < 3 ? -1 : digit(text[2]);
    const auto c = static_cast<char>(high * 16 + low);
    return high < 0 || low < 0 || c == '\0' || c == '/' ? std::nullopt : std::optional(c);
}

/// What follows scheme and host, still encoded; empty when they are not a local file's.
std::string_view encodedPath(std::string_view url)
{
    if (!startsWithIgnoringCase(url, scheme)) {
        return {};
    }
    url.remove_prefix(scheme.size());
    if (url.starts_with("//")) {
        url.remove_prefix(2);
        if (startsWithIgnoringCase(url, localHost)) {
            url.remove_prefix(localHost.size());
        }
    }
    return url;
}

}  // namespace

std::string fileUrlFromPath(std::string_view path)
{
    std::string url(scheme);
    url += "//";
    for (const char c : path) {
        if (standsForItself(c)) {
            url += c;
            continue;
        }
        const auto byte = static_cast<unsigned char>(c);
        url += '%';
        url += hexadecimalDigits[byte / 16];
        url += hexadecimalDigits[byte % 16];
    }
    return url;
}

std::optional<std::string> pathFromFileUrl(std::string_view url)
{
    auto rest = encodedPath(url);
    if (!rest.starts_with('/')) {
        return std::nullopt;
    }
    std::string path;
    while (!rest.empty() && path.size() <= longestFileUrlPath) {
        const bool isEscape = rest.front() == '%';
        const auto c = isEscape ? unescaped(rest) : std::optional(rest.front());
        if (!c || (!isEscape && !standsForItself(*c))) {
            return std::nullopt;
        }
        path += *c;
        rest.remove_prefix(isEscape ? 3 : 1);
    }
    return path.size() > longestFileUrlPath ? std::nullopt : std::optional(std::move(path));
}

}  // namespace typhon
