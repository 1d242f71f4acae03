#include "tools/change_text.h"

#include "platform/file_url.h"
#include "platform/linux/visible_text.h"
#include "tools/font_table.h"
#include "tools/property_list_json.h"

#include <fmt/format.h>

namespace typhon {

namespace {

std::string namesText(const PropertyList& entry)
{
    std::string text;
    for (const auto& face : facesIn(PropertyList::Dictionary{{"", entry}})) {
        text += fmt::format("{}{} / {}", text.empty() ? "" : ", ", face.family, face.postScriptName);
    }
    return text;
}

std::string fileText(const std::string& url, const PropertyList* fonts)
{
    const auto path = pathFromFileUrl(url).value_or(url);
    const auto* entry = fonts == nullptr ? nullptr : fonts->find(path);
    return entry == nullptr ? path : fmt::format("{} ({})", path, namesText(*entry));
}

std::string filesText(const char* what, const std::vector<std::string>& urls, const PropertyList* fonts)
{
    auto text = fmt::format("{} {} font file{}", what, urls.size(), urls.size() == 1 ? "" : "s");
    const char* separator = ": ";
    for (const auto& url : urls) {
        text += separator + fileText(url, fonts);
        separator = "; ";
    }
    return text;
}

nlohmann::json jsonOfStrings(const std::optional<std::vector<std::string>>& strings)
{
    return strings ? nlohmann::json(*strings) : nlohmann::json(nullptr);
}

}  // namespace

std::string changeText(const FontChangeNotice& change)
{
    const auto* fonts = change.info ? change.info->find("fontsInfo") : nullptr;
    std::string text;
    if (change.addedURLStrings) {
        text = filesText("added", *change.addedURLStrings, fonts);
    }
    if (change.removedURLStrings) {
        text += (text.empty() ? "" : "; ") + filesText("removed", *change.removedURLStrings, nullptr);
    }
    if (change.info && change.info->find("extension.provider") != nullptr) {
        text += " [extension.provider]";
    }
    return visibleText(text.empty() ? "a change without fonts" : text);
}

nlohmann::json changeJson(const FontChangeNotice& change)
{
    return {{"info", change.info ? jsonOf(*change.info) : nlohmann::json(nullptr)},
            {"addedURLStrings", jsonOfStrings(change.addedURLStrings)},
            {"removedURLStrings", jsonOfStrings(change.removedURLStrings)}};
}

}  // namespace typhon
