#include "platform/linux/font_trees.h"

#include <algorithm>
#include <array>

namespace typhon {

namespace {

constexpr std::array<FontTree, 4> trees{{
    {"/var/mobile/Library/UserFonts/FontFiles/", true},
    {"/var/mobile/Library/UserFonts/FontAssets/", true},
    {"/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/", false},
    {"/var/mobile/Library/Fonts/Managed/", false},
}};

std::string_view withoutFinalSlash(std::string_view path)
{
    return path.ends_with('/') ? path.substr(0, path.size() - 1) : path;
}

}  // namespace

bool isPlainPath(std::string_view path)
{
    if (path.size() < 2 || path.size() > 4095 || path.front() != '/' ||
        path.find('\0') != std::string_view::npos) {
        return false;
    }
    for (std::size_t from = 1; from <= path.size();) {
        const auto to = std::min(path.find('/', from), path.size());
        const auto component = path.substr(from, to - from);
        if (component.empty() || component == "." || component == "..") {
            return false;
        }
        from = to + 1;
    }
    return true;
}

const FontTree* fontTreeOf(std::string_view path)
{
    const auto found = std::ranges::find_if(trees, [&](const FontTree& tree) {
        return path.size() > tree.path.size() && path.starts_with(tree.path);
    });
    return found == trees.end() ? nullptr : &*found;
}

bool isGrantable(std::string_view path)
{
    const auto plain = withoutFinalSlash(path);
    return isPlainPath(plain) && std::ranges::any_of(trees, [&](const FontTree& tree) {
               return plain == withoutFinalSlash(tree.path) || plain.starts_with(tree.path);
           });
}

bool covers(std::string_view granted, std::string_view path)
{
    const auto top = withoutFinalSlash(granted);
    return path.starts_with(top) && (path.size() == top.size() || path[top.size()] == '/');
}

}  // namespace typhon
