#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace typhon {

/// A point in time: seconds since the Unix epoch.
struct Date {
    double seconds = 0;
    auto operator<=>(const Date&) const = default;  // NOLINT(modernize-use-nullptr): misread
};

/// Bytes, as opposed to text.
struct Data {
    std::vector<std::uint8_t> bytes;
    bool operator==(const Data&) const = default;
};

/// An immutable property-list value: boolean, 64-bit integer, real, string, data, date, array or
/// dictionary. Copies are cheap and share their contents; any thread may read any copy. A default
/// constructed value is the empty dictionary. Equality compares contents, and kinds strictly: true, 1 and
/// 1.0 all differ.
class PropertyList {
public:
    using Array = std::vector<PropertyList>;
    /// Sorted by key, bytewise, which is the order in which a dictionary is walked everywhere.
    using Dictionary = std::map<std::string, PropertyList, std::less<>>;
    enum class Kind { boolean, integer, real, string, data, date, array, dictionary };

    PropertyList();
    PropertyList(bool value);
    PropertyList(int value);
    PropertyList(std::int64_t value);
    PropertyList(double value);
    PropertyList(const char* value);
    PropertyList(std::string_view value);
    PropertyList(std::string value);
    PropertyList(Data value);
    PropertyList(Date value);
    PropertyList(Array value);
    PropertyList(Dictionary value);
    /// Any other pointer would silently become a boolean.
    PropertyList(const void*) = delete;

    Kind kind() const noexcept;

    /// The contents when the value is of that kind, else null (nothing is converted). The pointer lives as
    /// long as any copy of this value.
    const bool* asBoolean() const noexcept;
    const std::int64_t* asInteger() const noexcept;
    const double* asReal() const noexcept;
    const std::string* asString() const noexcept;
    const Data* asData() const noexcept;
    const Date* asDate() const noexcept;
    const Array* asArray() const noexcept;
    const Dictionary* asDictionary() const noexcept;

    /// The value under `key` when this is a dictionary that holds it, else null. Same lifetime as above.
    const PropertyList* find(std::string_view key) const noexcept;

    /// The contents of a dictionary, empty for any other kind; leaves this one empty. They are copied only
    /// when another copy shares them.
    Dictionary takeDictionary() &&;

    /// True for the boolean true, false for everything else.
    bool isTrue() const noexcept;

    /// Identifies the shared contents: equal for copies of one value, and reusable as a cache key for as
    /// long as the weak reference has not expired.
    std::weak_ptr<const void> identity() const noexcept;

    bool operator==(const PropertyList& other) const;

private:
    using Contents = std::variant<bool, std::int64_t, double, std::string, Data, Date, Array, Dictionary>;
    std::shared_ptr<const Contents> contents_;
};

/// An array of strings, for the many places that hold one; elements that are not strings are left out.
std::vector<std::string> stringsOf(const PropertyList& array);
PropertyList arrayOfStrings(const std::vector<std::string>& strings);

}  // namespace typhon
