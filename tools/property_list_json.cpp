#include "tools/property_list_json.h"

#include "platform/linux/base64.h"
#include "tools/date_text.h"

#include <cmath>
#include <limits>
#include <set>

namespace typhon {

namespace {

using nlohmann::json;

constexpr int deepest = 128;

json realAsJson(double value)
{
    if (std::isnan(value)) {
        return "nan";
    }
    if (std::isinf(value)) {
        return value > 0 ? "inf" : "-inf";
    }
    return value;
}

json arrayAsJson(const PropertyList::Array& array)
{
    auto made = json::array();
    for (const auto& element : array) {
        made.push_back(jsonOf(element));
    }
    return made;
}

json dictionaryAsJson(const PropertyList::Dictionary& dictionary)
{
    auto made = json::object();
    for (const auto& [key, value] : dictionary) {
        made[key] = jsonOf(value);
    }
    return made;
}

/// Stops the parser at what it would accept silently: a repeated key, too deep nesting.
class StrictParse {
public:
    bool operator()(int depth, json::parse_event_t event, json& parsed)
    {
        using Event = json::parse_event_t;
        if (event == Event::object_start) {
            keys_.emplace_back();
        } else if (event == Event::object_end) {
            keys_.pop_back();
        } else if (event == Event::key) {
            isSound_ = keys_.back().insert(parsed.get<std::string>()).second && isSound_;
        }
        isSound_ = isSound_ && depth <= deepest;
        return true;
    }
    bool isSound() const { return isSound_; }

private:
    std::vector<std::set<std::string>> keys_;
    bool isSound_ = true;
};

std::optional<PropertyList> propertyListOf(const json& value);

std::optional<PropertyList> arrayFrom(const json& value)
{
    PropertyList::Array array;
    for (const auto& element : value) {
        auto made = propertyListOf(element);
        if (!made) {
            return std::nullopt;
        }
        array.push_back(std::move(*made));
    }
    return PropertyList(std::move(array));
}

std::optional<PropertyList> dictionaryFrom(const json& value)
{
    PropertyList::Dictionary dictionary;
    for (const auto& [key, element] : value.items()) {
        auto made = propertyListOf(element);
        if (!made) {
            return std::nullopt;
        }
        dictionary.emplace(key, std::move(*made));
    }
    return PropertyList(std::move(dictionary));
}

std::optional<PropertyList> integerFrom(const json& value)
{
    if (value.is_number_unsigned() &&
        value.get<std::uint64_t>() > std::uint64_t{std::numeric_limits<std::int64_t>::max()}) {
        return std::nullopt;
    }
    return PropertyList(value.get<std::int64_t>());
}

std::optional<PropertyList> propertyListOf(const json& value)
{
    switch (value.type()) {
    case json::value_t::boolean:
        return PropertyList(value.get<bool>());
    case json::value_t::number_integer:
    case json::value_t::number_unsigned:
        return integerFrom(value);
    case json::value_t::number_float:
        return PropertyList(value.get<double>());
    case json::value_t::string:
        return PropertyList(value.get<std::string>());
    case json::value_t::array:
        return arrayFrom(value);
    case json::value_t::object:
        return dictionaryFrom(value);
    default:
        return std::nullopt;
    }
}

}  // namespace

json jsonOf(const PropertyList& value)
{
    switch (value.kind()) {
    case PropertyList::Kind::boolean:
        return *value.asBoolean();
    case PropertyList::Kind::integer:
        return *value.asInteger();
    case PropertyList::Kind::real:
        return realAsJson(*value.asReal());
    case PropertyList::Kind::string:
        return *value.asString();
    case PropertyList::Kind::data:
        return base64FromBytes(value.asData()->bytes);
    case PropertyList::Kind::date:
        return dateText(*value.asDate());
    case PropertyList::Kind::array:
        return arrayAsJson(*value.asArray());
    case PropertyList::Kind::dictionary:
        return dictionaryAsJson(*value.asDictionary());
    }
    return nullptr;
}

std::string jsonText(const json& value)
{
    return value.dump(2, ' ', false, json::error_handler_t::replace);
}

std::optional<PropertyList> propertyListFromJson(std::string_view text)
{
    StrictParse strict;
    const auto parsed = json::parse(text, std::ref(strict), false);
    return parsed.is_discarded() || !strict.isSound() ? std::nullopt : propertyListOf(parsed);
}

}  // namespace typhon
