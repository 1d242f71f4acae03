#include "platform/linux/catalogue_source.h"

#include "platform/linux/asset_catalogue.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <algorithm>
#include <cerrno>

namespace typhon {

namespace {

constexpr PropertyListLimits fileLimits{.bytes = 16 * 1024, .depth = 2, .values = 32};
constexpr std::size_t longestUrl = 2048;
constexpr std::int64_t longestStall = 3600;
constexpr std::int64_t longestDownload = std::int64_t{24} * 60 * 60;

std::string textMember(const PropertyList& file, std::string_view name)
{
    const auto* member = file.find(name);
    return member != nullptr && member->asString() != nullptr ? *member->asString() : std::string();
}

std::uint32_t secondsMember(const PropertyList& file, std::string_view name, std::uint32_t otherwise,
                            std::int64_t most)
{
    const auto* member = file.find(name);
    return member != nullptr && member->asInteger() != nullptr
               ? static_cast<std::uint32_t>(std::clamp(*member->asInteger(), std::int64_t{1}, most))
               : otherwise;
}

Result<CatalogueSource> sourceFrom(const PropertyList& file)
{
    CatalogueSource source;
    source.url = textMember(file, "URL");
    if (source.url.empty() || source.url.size() > longestUrl || visibleText(source.url) != source.url) {
        return {std::nullopt, "it has no \"URL\""};
    }
    source.certificates = textMember(file, "Certificates");
    source.stallSeconds = secondsMember(file, "StallSeconds", source.stallSeconds, longestStall);
    source.totalSeconds = secondsMember(file, "TotalSeconds", source.totalSeconds, longestDownload);
    return {std::move(source), {}};
}

}  // namespace

CatalogueSourceReading catalogueSourceOf(const RootDirectory& root, const std::string& assetType)
{
    const auto path = std::string(catalogueSourcesDirectory) + "/" + visibleText(assetType, 300) + ".plist";
    if (!isValidAssetId(assetType)) {
        return {{std::nullopt, "there is no such type of assets"}};
    }
    const auto opened = openRegularFile(root.real(path));
    if (opened.error != 0) {
        const bool isConfigured = opened.error != ENOENT;
        return {{std::nullopt,
                 isConfigured ? path + ": " + opened.errorText() : "no source is configured (" + path + ")"},
                isConfigured};
    }
    const auto reading = readPropertyListFromDescriptor(opened.file.get(), fileLimits);
    auto source = reading.value ? sourceFrom(*reading.value) : Result<CatalogueSource>{{}, reading.error};
    if (!source.value) {
        source.error = path + ": " + source.error;
    }
    return {std::move(source)};
}

}  // namespace typhon
