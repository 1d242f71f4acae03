#include "platform/linux/property_list_builder.h"

#include <utility>

namespace typhon {

const char* PropertyListBuilder::count()
{
    return ++values_ > limits_.values ? "too many values" : nullptr;
}

/// Whether a value may come next.
const char* PropertyListBuilder::checkPlace() const
{
    if (open_.empty())
        return root_ ? "more than one value" : nullptr;
    return open_.back().isDictionary && !open_.back().hasKey ? "a value without a key" : nullptr;
}

const char* PropertyListBuilder::begin(bool isDictionary)
{
    if (const char* error = checkPlace())
        return error;
    if (open_.size() == limits_.depth)
        return "nested too deeply";
    open_.emplace_back().isDictionary = isDictionary;
    return count();
}

const char* PropertyListBuilder::key(std::string key)
{
    if (open_.empty() || !open_.back().isDictionary)
        return "a key outside a dictionary";
    auto& container = open_.back();
    if (container.hasKey)
        return "a key without a value";
    container.key = std::move(key);
    container.hasKey = true;
    return count();
}

const char* PropertyListBuilder::value(PropertyList value)
{
    if (const char* error = checkPlace())
        return error;
    if (const char* error = count())
        return error;
    return add(std::move(value));
}

const char* PropertyListBuilder::add(PropertyList value)
{
    if (open_.empty()) {
        root_ = std::move(value);
        return nullptr;
    }
    auto& container = open_.back();
    if (!container.isDictionary) {
        container.array.push_back(std::move(value));
        return nullptr;
    }
    // Most writers sort their keys, so the end is the right place more often than not.
    auto& dictionary = container.dictionary;
    const auto size = dictionary.size();
    dictionary.emplace_hint(dictionary.end(), std::move(container.key), std::move(value));
    container.hasKey = false;
    return dictionary.size() == size ? "a duplicate key" : nullptr;
}

const char* PropertyListBuilder::end()
{
    auto& container = open_.back();
    if (container.hasKey)
        return "a key without a value";
    PropertyList value = container.isDictionary ? PropertyList(std::move(container.dictionary))
                                                : PropertyList(std::move(container.array));
    open_.pop_back();
    return add(std::move(value));
}

}  // namespace typhon
