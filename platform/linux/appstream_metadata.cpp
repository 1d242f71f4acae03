#include "platform/linux/appstream_metadata.h"

#include <charconv>
#include <cstddef>
#include <ctime>
#include <limits>
#include <memory>
#include <string_view>
#include <utility>

#include <expat.h>

// Only /component/id and /component/releases/release matter, so the parser counts how deep it is and
// remembers two levels. Texts of the identifier and the attributes are bounded; the document is, by its file.

namespace typhon {

namespace {

constexpr std::size_t longestText = 255;
constexpr int deepest = 64;

struct ParserDeleter {
    void operator()(XML_Parser parser) const { XML_ParserFree(parser); }
};

struct Reading {
    XML_Parser parser = nullptr;
    int depth = 0;
    bool inReleases = false;
    bool inIdentifier = false;
    bool isComponent = false;
    std::string identifier;
    std::optional<std::string> version;
    std::string date;

    void stop() { XML_StopParser(parser, XML_FALSE); }
};

std::string_view attributeOf(const XML_Char** attributes, std::string_view name)
{
    for (; *attributes != nullptr; attributes += 2) {
        if (name == *attributes) {
            return attributes[1];
        }
    }
    return {};
}

/// A date that sorts as text; empty when there is none.
std::string dateOf(const XML_Char** attributes)
{
    if (const auto date = attributeOf(attributes, "date"); !date.empty()) {
        return std::string(date.substr(0, longestText));
    }
    const auto timestamp = attributeOf(attributes, "timestamp");
    long long seconds = 0;
    const auto [end, error] = std::from_chars(timestamp.data(), timestamp.data() + timestamp.size(), seconds);
    const std::time_t time = seconds;
    std::tm parts{};
    char text[32];
    if (timestamp.empty() || error != std::errc() || ::gmtime_r(&time, &parts) == nullptr) {
        return {};
    }
    return {text, std::strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%SZ", &parts)};
}

void takeRelease(Reading& reading, const XML_Char** attributes)
{
    const auto version = attributeOf(attributes, "version");
    if (version.empty() || version.size() > longestText) {
        return;
    }
    auto date = dateOf(attributes);
    if (!reading.version || date > reading.date) {
        reading.version = std::string(version);
        reading.date = std::move(date);
    }
}

void startElement(void* context, const XML_Char* name, const XML_Char** attributes)
{
    auto& reading = *static_cast<Reading*>(context);
    const std::string_view element = name;
    if (++reading.depth > deepest) {
        reading.stop();
    } else if (reading.depth == 1) {
        reading.isComponent = element == "component" || element == "application";
    } else if (reading.depth == 2) {
        reading.inReleases = element == "releases";
        reading.inIdentifier = element == "id" && reading.identifier.empty();
    } else if (reading.depth == 3 && reading.inReleases && element == "release") {
        takeRelease(reading, attributes);
    }
}

void endElement(void* context, const XML_Char*)
{
    auto& reading = *static_cast<Reading*>(context);
    if (reading.depth-- == 2) {
        reading.inReleases = false;
        reading.inIdentifier = false;
    }
}

void takeText(void* context, const XML_Char* text, int length)
{
    auto& reading = *static_cast<Reading*>(context);
    if (!reading.inIdentifier || reading.depth != 2) {
        return;
    }
    reading.identifier.append(text, static_cast<std::size_t>(length));
    if (reading.identifier.size() > longestText) {
        reading.stop();
    }
}

void refuseEntity(void* context, const XML_Char*, int, const XML_Char*, int, const XML_Char*, const XML_Char*,
                  const XML_Char*, const XML_Char*)
{
    static_cast<Reading*>(context)->stop();
}

std::string trimmed(const std::string& text)
{
    constexpr const char* blanks = " \t\r\n";
    const auto start = text.find_first_not_of(blanks);
    return start == std::string::npos ? std::string()
                                      : text.substr(start, text.find_last_not_of(blanks) - start + 1);
}

}  // namespace

std::optional<AppStreamMetadata> parseAppStreamMetadata(std::span<const char> document)
{
    if (document.size() > std::size_t(std::numeric_limits<int>::max())) {
        return std::nullopt;
    }
    const std::unique_ptr<XML_ParserStruct, ParserDeleter> parser(XML_ParserCreate(nullptr));
    Reading reading;
    reading.parser = parser.get();
    XML_SetUserData(parser.get(), &reading);
    XML_SetElementHandler(parser.get(), startElement, endElement);
    XML_SetCharacterDataHandler(parser.get(), takeText);
    XML_SetEntityDeclHandler(parser.get(), refuseEntity);
    const auto status = XML_Parse(parser.get(), document.data(), static_cast<int>(document.size()), XML_TRUE);
    auto identifier = trimmed(reading.identifier);
    if (status != XML_STATUS_OK || !reading.isComponent || identifier.empty()) {
        return std::nullopt;
    }
    return AppStreamMetadata{.identifier = std::move(identifier), .version = std::move(reading.version)};
}

}  // namespace typhon
