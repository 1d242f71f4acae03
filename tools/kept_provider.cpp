#include "tools/kept_provider.h"

#include "platform/linux/durable_file.h"
#include "platform/linux/regular_file.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <string_view>
#include <vector>

#include <unistd.h>

// A provider is what the registry of applications knows, and that reads desktop entries. So an
// administrator's own fonts are kept by an entry that no menu shows. The mark in it says that it may be taken
// away again.

namespace typhon {

namespace {

constexpr std::string_view directory = "/usr/local/share/applications/";
constexpr std::string_view suffix = ".desktop";
constexpr std::string_view mark = "\nX-Typhon-KeptProvider=true\n";
constexpr std::size_t longestName = 255;
constexpr std::size_t mostBytes = 1u << 20;

bool isEntryName(const std::string& identifier)
{
    const bool isPlain = std::ranges::none_of(
        identifier, [](char c) { return c == '/' || static_cast<unsigned char>(c) < 0x20 || c == 0x7f; });
    return isPlain && !identifier.empty() && identifier.front() != '.' &&
           identifier.size() + suffix.size() + std::string_view(".new").size() <= longestName;
}

std::string textFor(const std::string& identifier)
{
    return "[Desktop Entry]\nType=Application\nName=" + identifier +
           "\nComment=Font provider without a program of its own\nNoDisplay=true" + std::string(mark);
}

struct Found {
    bool exists = false;
    bool isOurs = false;
};

Found look(const std::string& path)
{
    const auto opened = openRegularFile(path);
    if (opened.error == ENOENT) {
        return {};
    }
    const auto contents = opened.error == 0 ? readWhole(opened.file.get(), mostBytes) : FileContents{};
    const std::string text(contents.bytes.begin(), contents.bytes.end());
    return {.exists = true, .isOurs = text.find(mark) != std::string::npos};
}

}  // namespace

KeptProviderOutcome keepProvider(const RootDirectory& root, const std::string& identifier)
{
    if (!isEntryName(identifier)) {
        return {.path = {}, .error = "\"" + identifier + "\" cannot be the name of a desktop entry"};
    }
    const auto path = root.real(std::string(directory) + identifier + std::string(suffix));
    const auto found = look(path);
    if (found.exists) {
        return {.path = path,
                .error = found.isOurs ? std::nullopt : std::optional(path + " is there already")};
    }
    constexpr mode_t directoryPermissions = 0755;
    constexpr mode_t permissions = 0644;
    if (auto error = makeDirectories(directoryOf(path), directoryPermissions)) {
        return {.path = path, .error = std::move(error)};
    }
    const auto text = textFor(identifier);
    const std::vector<std::uint8_t> bytes(text.begin(), text.end());
    return {.path = path, .error = replaceFile(path, bytes, permissions)};
}

KeptProviderOutcome dropKeptProvider(const RootDirectory& root, const std::string& identifier)
{
    if (!isEntryName(identifier)) {
        return {.path = {}, .error = "\"" + identifier + "\" cannot be the name of a desktop entry"};
    }
    const auto path = root.real(std::string(directory) + identifier + std::string(suffix));
    if (!look(path).isOurs) {
        return {.path = path, .error = identifier + " is not kept by " + path};
    }
    const bool isGone = ::unlink(path.c_str()) == 0;
    return {.path = path, .error = isGone ? std::nullopt : std::optional(errorText(errno))};
}

}  // namespace typhon
