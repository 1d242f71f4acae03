// The binary form, in two passes without recursion. The first numbers all objects, breadth first: the list of
// objects is its own queue, and the references that containers make come out in the order in which the second
// pass needs them. Scalars that are equal become one object. Containers never do, not even those that share
// their contents in memory: otherwise equal values would not give equal bytes.

#include "platform/linux/binary_property_list_objects.h"
#include "platform/linux/carried_text.h"
#include "platform/linux/property_list_text.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/unicode.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <functional>
#include <limits>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {
namespace {

using Kind = PropertyList::Kind;
using Bytes = std::vector<std::uint8_t>;
using Reference = std::uint32_t;

/// One object: what it holds belongs to the value that is written.
struct Object {
    Kind kind;
    /// A boolean, integer, real or date, as bits that are equal when the values are.
    std::uint64_t bits = 0;
    /// A string, or data.
    std::string_view bytes{};
    const void* container = nullptr;

    bool operator==(const Object& other) const
    {
        return kind == other.kind && bits == other.bits && bytes == other.bytes;
    }
    bool isContainer() const { return container != nullptr; }
    const PropertyList::Array& array() const { return *static_cast<const PropertyList::Array*>(container); }
    const PropertyList::Dictionary& dictionary() const
    {
        return *static_cast<const PropertyList::Dictionary*>(container);
    }
};

std::uint64_t bitsOf(double real)
{
    return std::bit_cast<std::uint64_t>(std::isnan(real) ? std::numeric_limits<double>::quiet_NaN() : real);
}

Object stringObject(std::string_view text)
{
    return {Kind::string, 0, text};
}

Object objectOf(const PropertyList& value)
{
    const auto kind = value.kind();
    switch (kind) {
    case Kind::boolean:
        return {kind, *value.asBoolean() ? 1u : 0u};
    case Kind::integer:
        return {kind, std::bit_cast<std::uint64_t>(*value.asInteger())};
    case Kind::real:
        return {kind, bitsOf(*value.asReal())};
    case Kind::date:
        return {kind, bitsOf(carried(*value.asDate()).seconds - binaryPropertyListReferenceDate)};
    case Kind::string:
        return stringObject(*value.asString());
    case Kind::data: {
        const auto& bytes = value.asData()->bytes;
        return {kind, 0, {reinterpret_cast<const char*>(bytes.data()), bytes.size()}};
    }
    case Kind::array:
        return {kind, 0, {}, value.asArray()};
    case Kind::dictionary:
        return {kind, 0, {}, value.asDictionary()};
    }
    throw std::logic_error("a property list of no kind");
}

/// All objects of a value, numbered, and the references between them.
class ObjectTable {
public:
    explicit ObjectTable(const PropertyList& value);

    const std::vector<Object>& objects() const { return objects_; }
    /// Of one container after the other; for a dictionary all keys, then all values.
    const std::vector<Reference>& references() const { return references_; }

private:
    Reference append(const Object& object);
    Reference number(const Object& object);
    void grow();
    std::size_t slotOf(const Object& object) const;
    void addReferences(const PropertyList::Array& array);
    void addReferences(const PropertyList::Dictionary& dictionary);

    static constexpr Reference vacant = std::numeric_limits<Reference>::max();

    std::vector<Object> objects_;
    std::vector<Reference> references_;
    CarriedKeys carriedKeys_{CarriedText::unicode};
    /// Open addressing over the scalars in `objects_`, at most half full.
    std::vector<Reference> slots_ = std::vector<Reference>(64, vacant);
    std::size_t scalars_ = 0;
};

ObjectTable::ObjectTable(const PropertyList& value)
{
    number(objectOf(value));
    for (std::size_t next = 0; next < objects_.size(); ++next) {
        if (objects_[next].kind == Kind::array) {
            addReferences(objects_[next].array());
        } else if (objects_[next].kind == Kind::dictionary) {
            const auto& dictionary = carriedKeys_(objects_[next].dictionary());
            objects_[next].container = &dictionary;
            addReferences(dictionary);
        }
    }
}

void ObjectTable::addReferences(const PropertyList::Array& array)
{
    for (const auto& element : array)
        references_.push_back(number(objectOf(element)));
}

void ObjectTable::addReferences(const PropertyList::Dictionary& dictionary)
{
    for (const auto& [key, value] : dictionary)
        references_.push_back(number(stringObject(key)));
    for (const auto& [key, value] : dictionary)
        references_.push_back(number(objectOf(value)));
}

Reference ObjectTable::append(const Object& object)
{
    if (objects_.size() == vacant)
        throw std::length_error("a property list of more than 2^32 objects");
    objects_.push_back(object);
    return static_cast<Reference>(objects_.size() - 1);
}

std::size_t ObjectTable::slotOf(const Object& object) const
{
    const auto mask = slots_.size() - 1;
    // Multiplied, since the hash of a number may be the number itself.
    const auto hash = (std::hash<std::string_view>()(object.bytes) ^ object.bits) * 0x9E3779B97F4A7C15u;
    for (auto slot = static_cast<std::size_t>(hash >> 20) & mask;; slot = (slot + 1) & mask) {
        if (slots_[slot] == vacant || objects_[slots_[slot]] == object)
            return slot;
    }
}

void ObjectTable::grow()
{
    slots_.assign(slots_.size() * 2, vacant);
    for (Reference reference = 0; reference < objects_.size(); ++reference) {
        if (!objects_[reference].isContainer())
            slots_[slotOf(objects_[reference])] = reference;
    }
}

/// The number of an equal scalar, or a new one.
Reference ObjectTable::number(const Object& object)
{
    if (object.isContainer())
        return append(object);
    const auto slot = slotOf(object);
    if (slots_[slot] != vacant)
        return slots_[slot];
    const auto reference = slots_[slot] = append(object);
    if (++scalars_ * 2 > slots_.size())
        grow();
    return reference;
}

/// Bytes for numbers up to `largest`: a power of two.
std::size_t widthOf(std::uint64_t largest)
{
    const auto bytes = (static_cast<std::size_t>(std::bit_width(largest)) + 7) / 8;
    return std::bit_ceil(std::max<std::size_t>(bytes, 1));
}

class BinaryPropertyListWriter {
public:
    explicit BinaryPropertyListWriter(const PropertyList& value) : table_(value) {}
    Bytes write();

private:
    void number(std::uint64_t value, std::size_t width);
    void marker(BinaryObjectType type, std::uint8_t detail);
    void head(BinaryObjectType type, std::size_t count);
    void integer(std::int64_t value);
    void string(std::string_view text);
    void references(std::size_t count);
    void object(const Object& object);
    void offsets(const std::vector<std::uint64_t>& offsets);

    const ObjectTable table_;
    const std::size_t referenceWidth_ = widthOf(table_.objects().size() - 1);
    std::size_t nextReference_ = 0;
    Bytes bytes_{std::begin(binaryPropertyListMagic), std::end(binaryPropertyListMagic)};
};

void BinaryPropertyListWriter::number(std::uint64_t value, std::size_t width)
{
    for (auto shift = width * 8; shift != 0; shift -= 8)
        bytes_.push_back(static_cast<std::uint8_t>(value >> (shift - 8)));
}

void BinaryPropertyListWriter::marker(BinaryObjectType type, std::uint8_t detail)
{
    bytes_.push_back(static_cast<std::uint8_t>(static_cast<unsigned>(type) << 4 | detail));
}

void BinaryPropertyListWriter::head(BinaryObjectType type, std::size_t count)
{
    marker(type, static_cast<std::uint8_t>(std::min<std::size_t>(count, binaryLongCount)));
    if (count >= binaryLongCount)
        integer(static_cast<std::int64_t>(count));
}

/// Fewer than eight bytes are unsigned.
void BinaryPropertyListWriter::integer(std::int64_t value)
{
    const auto width = value < 0 ? 8 : widthOf(static_cast<std::uint64_t>(value));
    marker(BinaryObjectType::integer, static_cast<std::uint8_t>(std::countr_zero(width)));
    number(std::bit_cast<std::uint64_t>(value), width);
}

void BinaryPropertyListWriter::string(std::string_view text)
{
    if (isAscii(text)) {
        head(BinaryObjectType::ascii, text.size());
        bytes_.insert(bytes_.end(), text.begin(), text.end());
        return;
    }
    Bytes units;
    appendUtf16BigEndian(units, text);
    head(BinaryObjectType::utf16, units.size() / 2);
    bytes_.insert(bytes_.end(), units.begin(), units.end());
}

void BinaryPropertyListWriter::references(std::size_t count)
{
    for (; count != 0; --count)
        number(table_.references()[nextReference_++], referenceWidth_);
}

void BinaryPropertyListWriter::object(const Object& object)
{
    switch (object.kind) {
    case Kind::boolean:
        return marker(BinaryObjectType::constant, object.bits != 0 ? binaryTrue : binaryFalse);
    case Kind::integer:
        return integer(std::bit_cast<std::int64_t>(object.bits));
    case Kind::real:
    case Kind::date:
        marker(object.kind == Kind::real ? BinaryObjectType::real : BinaryObjectType::date, 3);
        return number(object.bits, 8);
    case Kind::string:
        return string(object.bytes);
    case Kind::data:
        head(BinaryObjectType::data, object.bytes.size());
        bytes_.insert(bytes_.end(), object.bytes.begin(), object.bytes.end());
        return;
    case Kind::array:
        head(BinaryObjectType::array, object.array().size());
        return references(object.array().size());
    case Kind::dictionary:
        head(BinaryObjectType::dictionary, object.dictionary().size());
        return references(object.dictionary().size() * 2);
    }
}

void BinaryPropertyListWriter::offsets(const std::vector<std::uint64_t>& offsets)
{
    const auto table = bytes_.size();
    const auto width = widthOf(table);
    for (const auto offset : offsets)
        number(offset, width);
    constexpr std::size_t unused = 6;
    number(0, unused);
    number(width, 1);
    number(referenceWidth_, 1);
    number(offsets.size(), 8);
    number(0, 8);
    number(table, 8);
}

Bytes BinaryPropertyListWriter::write()
{
    std::vector<std::uint64_t> places;
    places.reserve(table_.objects().size());
    for (const auto& each : table_.objects()) {
        places.push_back(bytes_.size());
        object(each);
    }
    offsets(places);
    return std::move(bytes_);
}

}  // namespace

std::vector<std::uint8_t> writeBinaryPropertyList(const PropertyList& value)
{
    return BinaryPropertyListWriter(value).write();
}

}  // namespace typhon
