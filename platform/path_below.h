#pragma once

#include <algorithm>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {

/// The names that lead from `tree` (with its final "/") to `path`, or null for a path that is not plainly
/// below it: it does not begin with it, or holds "..", or a zero byte. Blank names and "." are left out, so
/// the tree itself has no names.
inline std::optional<std::vector<std::string>> namesBelow(std::string_view tree, std::string_view path)
{
    if (!path.starts_with(tree) || path.find('\0') != std::string_view::npos) {
        return std::nullopt;
    }
    std::vector<std::string> names;
    for (auto from = tree.size(); from < path.size();) {
        const auto to = std::min(path.find('/', from), path.size());
        const auto name = path.substr(from, to - from);
        if (name == "..") {
            return std::nullopt;
        }
        if (!name.empty() && name != ".") {
            names.emplace_back(name);
        }
        from = to + 1;
    }
    return names;
}

}  // namespace typhon
