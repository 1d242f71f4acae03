#include "platform/linux/journal_event.h"

#include "platform/linux/visible_text.h"

#include <optional>

#include <fmt/format.h>

namespace typhon {

namespace {

constexpr std::size_t longestValue = 1024;
constexpr std::size_t longestFieldName = 64;

/// What the journal allows in a field's name.
std::string fieldNameOf(std::string_view key)
{
    std::string name = "TYPHON_EVENT_";
    for (const char c : key.substr(0, longestFieldName - name.size())) {
        const bool isLower = c >= 'a' && c <= 'z';
        const bool isPlain = (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
        const char capital = static_cast<char>(c - 'a' + 'A');
        name += isLower ? capital : isPlain ? c : '_';
    }
    return name;
}

std::optional<std::string> fieldValueOf(const PropertyList& value)
{
    if (const auto* text = value.asString()) {
        return visibleText(*text, longestValue);
    }
    if (const auto* number = value.asInteger()) {
        return std::to_string(*number);
    }
    return value.asBoolean() ? std::optional<std::string>(value.isTrue() ? "yes" : "no") : std::nullopt;
}

}  // namespace

EventFields eventFields(std::string_view name, const PropertyList& payload)
{
    const auto visibleName = visibleText(name, longestValue);
    auto message = "analytics event " + visibleName;
    EventFields own;
    const auto* entries = payload.asDictionary();
    for (const auto& [key, value] : entries == nullptr ? PropertyList::Dictionary{} : *entries) {
        if (const auto text = fieldValueOf(value)) {
            own.emplace_back(fieldNameOf(key), *text);
            message += fmt::format(", {} {}", visibleText(key, longestFieldName), *text);
        }
    }
    EventFields fields{{"MESSAGE", std::move(message)}, {"PRIORITY", "6"}, {"TYPHON_EVENT", visibleName}};
    fields.insert(fields.end(), own.begin(), own.end());
    return fields;
}

std::string eventText(const EventFields& fields)
{
    std::string text;
    for (const auto& [name, value] : fields) {
        text += name + "=" + value + "\n";
    }
    return text;
}

}  // namespace typhon
