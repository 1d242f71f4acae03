#include "tools/typed_value.h"

#include "platform/linux/base64.h"
#include "platform/linux/property_list_text.h"
#include "tools/property_list_json.h"

#include <charconv>
#include <cstdint>

namespace typhon {

namespace {

template <class Number>
std::optional<PropertyList> numberFrom(const std::string& text)
{
    Number number{};
    const char* end = text.data() + text.size();
    const auto [read, error] = std::from_chars(text.data(), end, number);
    return error != std::errc{} || read != end ? std::nullopt : std::optional(PropertyList(number));
}

std::optional<PropertyList> dataFrom(const std::string& text)
{
    auto bytes = bytesFromBase64(text);
    return bytes ? std::optional(PropertyList(Data{std::move(*bytes)})) : std::nullopt;
}

std::optional<PropertyList> dateFrom(const std::string& text)
{
    const auto date = dateFromText(text);
    return date ? std::optional(PropertyList(*date)) : std::nullopt;
}

std::optional<PropertyList> booleanFrom(const std::string& text)
{
    if (text == "true" || text == "false") {
        return PropertyList(text == "true");
    }
    return std::nullopt;
}

std::optional<PropertyList> guessed(const std::string& text)
{
    if (auto value = propertyListFromJson(text)) {
        return value;
    }
    const bool beginsLikeJson = text.find_first_of("{[\"") == 0;
    return beginsLikeJson ? std::nullopt : std::optional(PropertyList(text));
}

}  // namespace

std::optional<PropertyList> typedValue(const std::string& text, const std::string& type)
{
    if (type == "boolean") {
        return booleanFrom(text);
    }
    if (type == "integer") {
        return numberFrom<std::int64_t>(text);
    }
    if (type == "real") {
        return numberFrom<double>(text);
    }
    if (type == "string") {
        return PropertyList(text);
    }
    if (type == "data") {
        return dataFrom(text);
    }
    if (type == "date") {
        return dateFrom(text);
    }
    return type == "json" ? propertyListFromJson(text) : guessed(text);
}

}  // namespace typhon
