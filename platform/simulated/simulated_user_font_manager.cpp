#include "platform/simulated/simulated_user_font_manager.h"

#include <algorithm>
#include <cstdio>
#include <string_view>
#include <utility>

// Directory names follow the library's rule, which is small enough to be said again here: this room knows
// nothing of the library's, and the contract suite holds both to the same names.

namespace typhon {

namespace {

constexpr std::size_t longestFileName = 255;

bool standsForItself(char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' || c == '.';
}

std::string escaped(char c)
{
    std::string text(4, '\0');
    std::snprintf(text.data(), text.size(), "%%%02X", static_cast<unsigned>(static_cast<unsigned char>(c)));
    text.pop_back();
    return text;
}

int hexadecimal(char digit)
{
    const auto found = std::string_view("0123456789ABCDEF").find(digit);
    return found == std::string_view::npos ? -1 : static_cast<int>(found);
}

}  // namespace

std::optional<std::string>
SimulatedUserFontManager::directoryNameFromIdentifier(const std::string& identifier)
{
    const bool isDots = identifier == "." || identifier == "..";
    std::string name;
    for (const char c : identifier) {
        name += standsForItself(c) && !isDots ? std::string(1, c) : escaped(c);
    }
    return name.empty() || name.size() > longestFileName ? std::nullopt : std::optional(name);
}

std::optional<std::string>
SimulatedUserFontManager::identifierFromDirectoryName(const std::string& directoryName)
{
    std::string identifier;
    for (std::size_t at = 0; at < directoryName.size(); ++at) {
        if (directoryName[at] != '%') {
            identifier += directoryName[at];
            continue;
        }
        if (directoryName.size() - at < 3) {
            return std::nullopt;
        }
        const int high = hexadecimal(directoryName[at + 1]);
        const int low = hexadecimal(directoryName[at + 2]);
        if (high < 0 || low < 0) {
            return std::nullopt;
        }
        identifier += static_cast<char>(high * 16 + low);
        at += 2;
    }
    return directoryNameFromIdentifier(identifier) == directoryName ? std::optional(identifier)
                                                                    : std::nullopt;
}

void SimulatedUserFontManager::synchronizeProfileFonts(std::function<void()> completion)
{
    ++profileSynchronizations_;
    pending_.push_back(std::move(completion));
}

void SimulatedUserFontManager::finishProfileSynchronizations()
{
    for (const auto& completion : std::exchange(pending_, {})) {
        if (completion) {
            completion();
        }
    }
}

}  // namespace typhon
