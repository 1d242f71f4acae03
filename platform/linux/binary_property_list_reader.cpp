// Assembles the objects of the binary form into one value: containers refer to other objects by number, in
// any pattern. They are read with an explicit stack, each object at most once, and what the whole would cost
// written out in full is added up as it is assembled, so that a small file cannot stand for an enormous
// value.

#include "platform/linux/binary_property_list_reader.h"

#include "platform/linux/binary_property_list_objects.h"

#include <algorithm>
#include <limits>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace typhon {
namespace {

/// What a value costs written out in full, and how deeply it nests.
struct Weight {
    std::size_t values = 0;
    std::size_t bytes = 0;
    std::size_t height = 0;
};

struct Finished {
    PropertyList value;
    Weight weight;
};

/// A container of which some elements are still to be read.
struct OpenContainer {
    std::size_t object;
    BinaryPropertyListObjects::Head head;
    /// What everything cost before it.
    Weight before;
    /// Elements that it has already.
    std::size_t size = 0;
    std::size_t height = 1;
    PropertyList::Array array{};
    PropertyList::Dictionary dictionary{};

    bool isDictionary() const { return head.type == BinaryObjectType::dictionary; }
    /// Of the reference to the next element. A dictionary has all its keys first.
    std::size_t nextReference() const { return isDictionary() ? head.count + size : size; }
};

class BinaryPropertyListReader {
public:
    BinaryPropertyListReader(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits)
        : objects_(bytes), limits_(limits)
    {}

    PropertyListReading read();

private:
    using Head = BinaryPropertyListObjects::Head;

    bool readAll();
    bool visit(std::size_t object, std::size_t referrer);
    bool readScalar(std::size_t object, const Head& head, std::size_t referrer);
    bool openContainer(std::size_t object, const Head& head, std::size_t referrer);
    bool readNextElement();
    bool addToInnermost(const Finished& element);
    std::optional<std::string> readKey(const OpenContainer& dictionary);
    bool closeContainer();
    const Finished& finish(std::size_t object, PropertyList value, const Weight& weight);
    const Finished* finished(std::size_t object) const;
    bool charge(const Weight& weight, std::size_t offset);

    static constexpr std::uint32_t unread = 0;
    static constexpr std::uint32_t beingRead = 1;
    static constexpr std::uint32_t firstFinished = 2;

    BinaryPropertyListObjects objects_;
    const PropertyListLimits limits_;
    /// By object: one of the above, or `firstFinished` plus its index in `finished_`.
    std::vector<std::uint32_t> states_;
    std::vector<Finished> finished_;
    std::vector<OpenContainer> open_;
    Weight total_;
};

/// Adds what stands at `offset` to the cost of the whole.
bool BinaryPropertyListReader::charge(const Weight& weight, std::size_t offset)
{
    total_.values += weight.values;
    total_.bytes += weight.bytes;
    if (total_.values > limits_.values)
        return objects_.refuse("too many values", offset);
    if (total_.bytes > limits_.bytes)
        return objects_.refuse("too much text and data", offset);
    if (open_.size() + weight.height > limits_.depth)
        return objects_.refuse("nested too deeply", offset);
    return true;
}

const Finished& BinaryPropertyListReader::finish(std::size_t object, PropertyList value, const Weight& weight)
{
    states_[object] = static_cast<std::uint32_t>(firstFinished + finished_.size());
    return finished_.emplace_back(Finished{std::move(value), weight});
}

const Finished* BinaryPropertyListReader::finished(std::size_t object) const
{
    const auto state = states_[object];
    return state < firstFinished ? nullptr : &finished_[state - firstFinished];
}

/// Finishes an object that is referred to at the offset `referrer`, or opens it when it is a container: then
/// it adds itself to the container that is now the innermost, when it closes.
bool BinaryPropertyListReader::visit(std::size_t object, std::size_t referrer)
{
    if (states_[object] == beingRead)
        return objects_.refuse("a container contains itself", referrer);
    if (const auto* known = finished(object))
        return charge(known->weight, referrer);
    const auto head = objects_.head(object);
    if (!head)
        return false;
    return head->isContainer() ? openContainer(object, *head, referrer) : readScalar(object, *head, referrer);
}

bool BinaryPropertyListReader::readScalar(std::size_t object, const Head& head, std::size_t referrer)
{
    auto value = objects_.scalar(head);
    if (!value)
        return false;
    Weight weight{1, 0, 0};
    if (const auto* string = value->asString())
        weight.bytes = string->size();
    else if (const auto* data = value->asData())
        weight.bytes = data->bytes.size();
    finish(object, std::move(*value), weight);
    return charge(weight, referrer);
}

bool BinaryPropertyListReader::openContainer(std::size_t object, const Head& head, std::size_t referrer)
{
    const auto before = total_;
    if (!charge({1, 0, 1}, referrer))
        return false;
    states_[object] = beingRead;
    auto& container = open_.emplace_back(OpenContainer{object, head, before});
    // A claim like any other: not worth much memory before it is met.
    constexpr std::size_t mostReserved = 1024;
    if (!container.isDictionary())
        container.array.reserve(std::min(head.count, mostReserved));
    return true;
}

bool BinaryPropertyListReader::readNextElement()
{
    const auto& container = open_.back();
    const auto index = container.nextReference();
    const auto object = objects_.reference(container.head, index);
    if (!object || !visit(*object, objects_.referenceOffset(container.head, index)))
        return false;
    const auto* element = finished(*object);
    return element == nullptr || addToInnermost(*element);
}

bool BinaryPropertyListReader::addToInnermost(const Finished& element)
{
    auto& container = open_.back();
    container.height = std::max(container.height, element.weight.height + 1);
    if (!container.isDictionary()) {
        container.array.push_back(element.value);
        ++container.size;
        return true;
    }
    auto key = readKey(container);
    if (!key)
        return false;
    // The end is the right place when keys are sorted, as most writers do.
    auto& dictionary = container.dictionary;
    dictionary.emplace_hint(dictionary.end(), std::move(*key), element.value);
    if (dictionary.size() == container.size)
        return objects_.refuse("a duplicate key", objects_.referenceOffset(container.head, container.size));
    ++container.size;
    return true;
}

/// The key of the next element. Keys are not kept as values: most occur once, and the others are short.
std::optional<std::string> BinaryPropertyListReader::readKey(const OpenContainer& dictionary)
{
    const auto object = objects_.reference(dictionary.head, dictionary.size);
    const auto head = object ? objects_.head(*object) : std::nullopt;
    if (!head)
        return std::nullopt;
    const auto offset = objects_.referenceOffset(dictionary.head, dictionary.size);
    if (!head->isString()) {
        objects_.refuse("a key that is not a string", offset);
        return std::nullopt;
    }
    auto key = objects_.text(*head);
    return key && charge({1, key->size(), 0}, offset) ? std::move(key) : std::nullopt;
}

bool BinaryPropertyListReader::closeContainer()
{
    auto& container = open_.back();
    const auto object = container.object;
    const Weight weight{total_.values - container.before.values, total_.bytes - container.before.bytes,
                        container.height};
    auto value = container.isDictionary() ? PropertyList(std::move(container.dictionary))
                                          : PropertyList(std::move(container.array));
    open_.pop_back();
    const auto& element = finish(object, std::move(value), weight);
    return open_.empty() || addToInnermost(element);
}

bool BinaryPropertyListReader::readAll()
{
    // The states of objects have to fit 32 bits.
    constexpr std::size_t mostObjects = std::numeric_limits<std::uint32_t>::max() - firstFinished;
    if (!objects_.readTrailer(std::min(limits_.values, mostObjects)))
        return false;
    states_.assign(objects_.count(), unread);
    constexpr std::size_t mostReserved = 1u << 16;
    finished_.reserve(std::min(objects_.count(), mostReserved));
    if (!visit(objects_.top(), 0))
        return false;
    while (!open_.empty()) {
        const auto& container = open_.back();
        if (container.size == container.head.count ? !closeContainer() : !readNextElement())
            return false;
    }
    return true;
}

PropertyListReading BinaryPropertyListReader::read()
{
    if (!readAll())
        return {std::nullopt, objects_.error()};
    return {finished(objects_.top())->value, {}};
}

}  // namespace

PropertyListReading readBinaryPropertyList(std::span<const std::uint8_t> bytes,
                                           const PropertyListLimits& limits)
{
    return BinaryPropertyListReader(bytes, limits).read();
}

}  // namespace typhon
