#pragma once

#include "platform/font_directories.h"

#include <string_view>

namespace typhon {

/// Whether a path lies in one of the two trees whose files may be scheduled. A plain test for the prefix:
/// what such a path really leads to is for the deletion itself to judge.
constexpr bool isInFontTree(std::string_view path)
{
    return path.starts_with(font_directories::fontFiles) || path.starts_with(font_directories::fontAssets);
}

/// The folder that holds what is at `path`, without a final "/"; empty when there is none.
constexpr std::string_view parentOf(std::string_view path)
{
    const auto withoutFinalSlashes = [](std::string_view text) {
        return text.substr(0, text.find_last_not_of('/') + 1);
    };
    path = withoutFinalSlashes(path);
    const auto slash = path.rfind('/');
    return slash == std::string_view::npos ? std::string_view() : withoutFinalSlashes(path.substr(0, slash));
}

}  // namespace typhon
