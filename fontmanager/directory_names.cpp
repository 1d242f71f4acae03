#include "fontmanager/directory_names.h"

#include <cstddef>

#include <fmt/format.h>

namespace typhon {

namespace {

constexpr std::size_t longestFileName = 255;

bool standsForItself(char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' || c == '.';
}

/// The value of the two upper-case hexadecimal digits at the start of `digits`, or null.
std::optional<char> escapedByte(std::string_view digits)
{
    constexpr std::string_view hexadecimal = "0123456789ABCDEF";
    if (digits.size() < 2) {
        return std::nullopt;
    }
    const auto high = hexadecimal.find(digits[0]);
    const auto low = hexadecimal.find(digits[1]);
    if (high == std::string_view::npos || low == std::string_view::npos) {
        return std::nullopt;
    }
    return static_cast<char>(high * 16 + low);
}

}  // namespace

std::optional<std::string> directoryNameFromIdentifier(std::string_view identifier)
{
    if (identifier.empty() || identifier.size() > longestFileName) {
        return std::nullopt;
    }
    const bool isDots = identifier == "." || identifier == "..";
    std::string name;
    for (const char c : identifier) {
        if (standsForItself(c) && !isDots) {
            name += c;
        } else {
            name += fmt::format("%{:02X}", static_cast<unsigned char>(c));
        }
    }
    return name.size() > longestFileName ? std::nullopt : std::optional(name);
}

std::optional<std::string> identifierFromDirectoryName(std::string_view directoryName)
{
    std::string identifier;
    for (std::size_t at = 0; at < directoryName.size(); ++at) {
        if (directoryName[at] != '%') {
            identifier += directoryName[at];
            continue;
        }
        const auto byte = escapedByte(directoryName.substr(at + 1));
        if (!byte) {
            return std::nullopt;
        }
        identifier += *byte;
        at += 2;
    }
    // Names have one spelling each: whatever would be written differently is nobody's.
    return directoryNameFromIdentifier(identifier) == directoryName ? std::optional(identifier)
                                                                    : std::nullopt;
}

}  // namespace typhon
