#include "tools/property_list_text.h"

#include "platform/linux/visible_text.h"
#include "tools/date_text.h"

#include <algorithm>

#include <fmt/format.h>

namespace typhon {

namespace {

using Kind = PropertyList::Kind;

std::string dataText(const Data& data)
{
    constexpr std::size_t shown = 16;
    std::string bytes;
    for (std::size_t i = 0; i < std::min(data.bytes.size(), shown); ++i) {
        bytes += fmt::format(" {:02x}", data.bytes[i]);
    }
    return fmt::format("<{} bytes{}{}{}>", data.bytes.size(), bytes.empty() ? "" : ":", bytes,
                       data.bytes.size() > shown ? " ..." : "");
}

/// A value that fits on one line; empty for a container with contents.
std::string lineText(const PropertyList& value)
{
    switch (value.kind()) {
    case Kind::boolean:
        return *value.asBoolean() ? "true" : "false";
    case Kind::integer:
        return fmt::format("{}", *value.asInteger());
    case Kind::real:
        return fmt::format("{:#}", *value.asReal());
    case Kind::string:
        return "\"" + visibleText(*value.asString()) + "\"";
    case Kind::data:
        return dataText(*value.asData());
    case Kind::date:
        return dateText(*value.asDate());
    case Kind::array:
        return value.asArray()->empty() ? "(empty array)" : "";
    case Kind::dictionary:
        return value.asDictionary()->empty() ? "(empty dictionary)" : "";
    }
    return {};
}

void append(std::string& text, const PropertyList& value, std::size_t indent);

void appendLabelled(std::string& text, const std::string& label, const PropertyList& value,
                    std::size_t indent)
{
    const auto line = lineText(value);
    text += std::string(indent, ' ') + label + (line.empty() ? "" : " " + line) + "\n";
    if (line.empty()) {
        append(text, value, indent + 2);
    }
}

void append(std::string& text, const PropertyList& value, std::size_t indent)
{
    if (const auto* array = value.asArray()) {
        for (const auto& element : *array) {
            appendLabelled(text, "-", element, indent);
        }
    } else if (const auto* dictionary = value.asDictionary()) {
        for (const auto& [key, element] : *dictionary) {
            appendLabelled(text, visibleText(key) + ":", element, indent);
        }
    }
}

}  // namespace

std::string propertyListText(const PropertyList& value)
{
    const auto line = lineText(value);
    if (!line.empty()) {
        return line + "\n";
    }
    std::string text;
    append(text, value, 0);
    return text;
}

}  // namespace typhon
