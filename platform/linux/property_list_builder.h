#pragma once

#include "platform/linux/property_list_reader.h"

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// Assembles one property list from its parts in document order, within limits on depth and number of
/// values. Every step returns null, or a constant text saying what is wrong; after that the builder is of
/// no further use.
class PropertyListBuilder {
public:
    explicit PropertyListBuilder(const PropertyListLimits& limits) : limits_(limits) {}

    const char* beginArray() { return begin(false); }
    const char* beginDictionary() { return begin(true); }
    /// The key of the next value of the innermost container, which must be a dictionary.
    const char* key(std::string key);
    const char* value(PropertyList value);
    /// Ends the innermost container; there must be one.
    const char* end();

    /// How many containers are open.
    std::size_t depth() const noexcept { return open_.size(); }
    /// The finished outermost value; null when there was none.
    std::optional<PropertyList> take() { return std::move(root_); }

private:
    struct Container {
        bool isDictionary = false;
        bool hasKey = false;
        std::string key;
        PropertyList::Array array;
        PropertyList::Dictionary dictionary;
    };

    const char* begin(bool isDictionary);
    const char* count();
    const char* add(PropertyList value);
    const char* checkPlace() const;

    const PropertyListLimits limits_;
    std::size_t values_ = 0;
    std::vector<Container> open_;
    std::optional<PropertyList> root_;
};

}  // namespace typhon
