#include "assets/font_asset_paths.h"

#include "platform/font_directories.h"

#include <string_view>

namespace typhon {

namespace {

std::string_view withoutTrailingSlashes(std::string_view path)
{
    while (path.size() > 1 && path.ends_with('/')) {
        path.remove_suffix(1);
    }
    return path;
}

std::string_view lastComponent(std::string_view path)
{
    path = withoutTrailingSlashes(path);
    return path.substr(path.rfind('/') + 1);
}

std::string_view withoutLastComponent(std::string_view path)
{
    path = withoutTrailingSlashes(path);
    const auto end = path.rfind('/');
    return end == std::string_view::npos ? std::string_view{} : withoutTrailingSlashes(path.substr(0, end));
}

void complain(Log& log, std::string_view path)
{
    TYLog_Error(log, "synchronizeFontAssets got a non-asset font file path: " + std::string(path));
}

}  // namespace

std::optional<std::string> assetDirectoryNameOf(const std::string& path, Log& log)
{
    if (!path.starts_with(font_directories::assetStore)) {
        complain(log, path);
        return std::nullopt;
    }
    const auto parent = withoutLastComponent(path);
    if (lastComponent(parent) != "AssetData") {
        // Intended: the directory, where the message above has the file.
        complain(log, parent);
        return std::nullopt;
    }
    return std::string(lastComponent(withoutLastComponent(parent)));
}

std::set<std::string, std::less<>> assetDirectoryNamesOf(const std::vector<std::string>& paths, Log& log)
{
    std::set<std::string, std::less<>> names;
    for (const auto& path : paths) {
        if (auto name = assetDirectoryNameOf(path, log)) {
            names.insert(*std::move(name));
        }
    }
    return names;
}

}  // namespace typhon
