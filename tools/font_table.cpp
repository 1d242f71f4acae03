#include "tools/font_table.h"

#include "sdk/font_grant.h"
#include "tools/table.h"

#include <algorithm>
#include <array>
#include <tuple>
#include <utility>

#include <fmt/format.h>

namespace typhon {

namespace {

using Extension = std::pair<const char*, const char*>;

constexpr std::array extensions{
    Extension{"extension", "every file in /var/mobile/Library/UserFonts/FontFiles"},
    Extension{"extension.fontasset", "every file in /var/mobile/Library/UserFonts/FontAssets"},
    Extension{"extension.provider", "every file in this provider's own directory"},
};

std::string accessText(const FontGrant& grant)
{
    if (!grant.source.empty()) {
        return grant.source == "data" ? "own token" : std::string(grant.source);
    }
    return grant.way == FontGrant::Way::ownAccess ? "by itself" : "no token needed";
}

std::string countText(std::size_t files, std::size_t faces)
{
    return fmt::format("{} font file{} with {} face{}\n", files, files == 1 ? "" : "s", faces,
                       faces == 1 ? "" : "s");
}

std::string extensionsText(const PropertyList& checkin)
{
    std::string text;
    for (const auto& [key, meaning] : extensions) {
        if (checkin.find(key) != nullptr) {
            text += fmt::format("  {}: {}\n", key, meaning);
        }
    }
    return text.empty() ? "Extensions: none\n" : "Extensions:\n" + text;
}

std::size_t sizeOf(const PropertyList& dictionary)
{
    return dictionary.asDictionary() == nullptr ? 0 : dictionary.asDictionary()->size();
}

}  // namespace

std::vector<ListedFace> facesIn(const PropertyList& fonts)
{
    std::vector<ListedFace> faces;
    const PropertyList::Dictionary none;
    const auto* files = fonts.asDictionary();
    for (const auto& [path, entry] : files == nullptr ? none : *files) {
        const auto* names = entry.find("familyName");
        const auto* pairs = names == nullptr ? nullptr : names->asDictionary();
        if (pairs == nullptr || pairs->empty()) {
            faces.push_back({{}, {}, path, entry});
            continue;
        }
        for (const auto& [postScriptName, family] : *pairs) {
            const auto* text = family.asString();
            faces.push_back({text == nullptr ? "" : *text, postScriptName, path, entry});
        }
    }
    std::sort(faces.begin(), faces.end(), [](const ListedFace& one, const ListedFace& other) {
        return std::tie(one.family, one.postScriptName, one.path) <
               std::tie(other.family, other.postScriptName, other.path);
    });
    return faces;
}

std::string checkinText(const PropertyList& checkin)
{
    const auto* listed = checkin.find("fontsInfo");
    const auto fonts = listed == nullptr ? PropertyList() : *listed;
    const auto faces = facesIn(fonts);
    Table table({"Family", "PostScript name", "Opened with", "File"});
    for (const auto& face : faces) {
        table.addRow(
            {face.family, face.postScriptName, accessText(fontGrantFor(checkin, face.path)), face.path});
    }
    auto text = faces.empty() ? std::string() : table.text() + "\n";
    text += countText(sizeOf(fonts), faces.size()) + extensionsText(checkin);
    const auto* hidden = checkin.find("hide-profilefonts");
    if (hidden != nullptr && hidden->isTrue()) {
        text += "Profile fonts are hidden from this program.\n";
    }
    return text;
}

std::string registryText(const PropertyList& registry)
{
    const auto faces = facesIn(registry);
    Table table({"Family", "PostScript name", "State", "File"});
    for (const auto& face : faces) {
        const auto* disabled = face.entry.find("disabled");
        const bool isOff = disabled != nullptr && disabled->isTrue();
        table.addRow({face.family, face.postScriptName, isOff ? "off" : "on", face.path});
    }
    return (faces.empty() ? std::string() : table.text() + "\n") + countText(sizeOf(registry), faces.size());
}

}  // namespace typhon
