#include "fontmanager/font_paths.h"

#include "fontmanager/directory_names.h"
#include "platform/linux/visible_text.h"

#include <algorithm>
#include <array>
#include <cstddef>

namespace typhon::font_paths {

namespace {

constexpr std::size_t longestFileName = 255;

bool isComponent(std::string_view name)
{
    return !name.empty() && name != "." && name != ".." && name.find('/') == std::string_view::npos &&
           name.find('\0') == std::string_view::npos;
}

char lowerCase(char c)
{
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

}  // namespace

std::optional<std::string> fontDirectoryOfProvider(std::string_view identifier)
{
    const auto name = directoryNameFromIdentifier(identifier);
    return name ? std::optional(fontFiles + *name) : std::nullopt;
}

std::optional<FontFilePlace> placeOfFontFile(std::string_view path)
{
    if (!path.starts_with(fontFiles)) {
        return std::nullopt;
    }
    path.remove_prefix(std::string_view(fontFiles).size());
    const auto slash = path.find('/');
    if (slash == std::string_view::npos) {
        return std::nullopt;
    }
    const auto directory = path.substr(0, slash);
    const auto name = path.substr(slash + 1);
    return isComponent(directory) && isComponent(name)
               ? std::optional(FontFilePlace{std::string(directory), std::string(name)})
               : std::nullopt;
}

bool endsLikeAFont(std::string_view name)
{
    constexpr std::size_t length = 4;
    if (name.size() <= length) {
        return false;
    }
    std::string ending(name.substr(name.size() - length));
    std::ranges::transform(ending, ending.begin(), lowerCase);
    constexpr std::array<std::string_view, 4> endings = {".ttf", ".otf", ".ttc", ".otc"};
    return std::ranges::find(endings, ending) != endings.end();
}

std::optional<std::string> objectionToFontFileName(std::string_view name)
{
    if (!isComponent(name) || name.front() == '.' || name != visibleText(name)) {
        return "a font file needs a plain name that does not begin with a dot";
    }
    if (name.size() > longestFileName) {
        return "its name is longer than " + std::to_string(longestFileName) + " bytes";
    }
    if (!endsLikeAFont(name)) {
        return "its name does not end in .ttf, .otf, .ttc or .otc";
    }
    return std::nullopt;
}

}  // namespace typhon::font_paths
