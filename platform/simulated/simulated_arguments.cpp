#include "platform/simulated/simulated_arguments.h"

#include "platform/argument_types.h"

#include <algorithm>
#include <cstdint>
#include <limits>

namespace typhon {

namespace {

bool fits(std::string_view type, const PropertyList& value);

template <class T>
bool isIntegerOf(const PropertyList& value)
{
    const auto* number = value.asInteger();
    return number != nullptr && *number >= static_cast<std::int64_t>(std::numeric_limits<T>::min()) &&
           (sizeof(T) == 8 || *number <= static_cast<std::int64_t>(std::numeric_limits<T>::max()));
}

bool arrayFits(std::string_view elementType, const PropertyList& value)
{
    if (elementType == "y") {
        return value.asData() != nullptr;
    }
    if (elementType.front() == '{') {
        const auto valueType = elementType.substr(2, elementType.size() - 3);
        const auto* entries = value.asDictionary();
        return entries != nullptr && std::all_of(entries->begin(), entries->end(), [&](const auto& entry) {
                   return fits(valueType, entry.second);
               });
    }
    const auto* elements = value.asArray();
    return elements != nullptr && std::all_of(elements->begin(), elements->end(), [&](const auto& element) {
               return fits(elementType, element);
           });
}

bool structureFits(std::string_view fields, const PropertyList& value)
{
    if (fields == "d") {
        return value.asDate() != nullptr;
    }
    const auto* elements = value.asArray();
    if (elements == nullptr) {
        return false;
    }
    for (const auto& element : *elements) {
        if (fields.empty() || !fits(takeCompleteType(fields), element)) {
            return false;
        }
    }
    return fields.empty();
}

bool fits(std::string_view type, const PropertyList& value)
{
    switch (type.front()) {
    case 'b':
        return value.asBoolean() != nullptr;
    case 'y':
        return isIntegerOf<std::uint8_t>(value);
    case 'n':
        return isIntegerOf<std::int16_t>(value);
    case 'q':
        return isIntegerOf<std::uint16_t>(value);
    case 'i':
        return isIntegerOf<std::int32_t>(value);
    case 'u':
        return isIntegerOf<std::uint32_t>(value);
    case 'x':
        return isIntegerOf<std::int64_t>(value);
    case 't':
        return isIntegerOf<std::uint64_t>(value);
    case 'd':
        return value.asReal() != nullptr;
    case 's':
        return value.asString() != nullptr;
    case 'v':
        return true;
    case 'a':
        return arrayFits(type.substr(1), value);
    case '(':
        return structureFits(type.substr(1, type.size() - 2), value);
    default:
        return false;
    }
}

bool fits(std::string_view type, const Argument& argument)
{
    if (const auto* file = std::get_if<std::shared_ptr<TransferredFile>>(&argument)) {
        return type == "h" && *file != nullptr;
    }
    return fits(type, std::get<PropertyList>(argument));
}

}  // namespace

bool argumentsFit(std::string_view types, const Arguments& arguments)
{
    for (const auto& argument : arguments) {
        if (types.empty() || !fits(takeCompleteType(types), argument)) {
            return false;
        }
    }
    return types.empty();
}

}  // namespace typhon
