#include "platform/linux/binary_property_list_objects.h"

#include "platform/linux/property_list_text.h"
#include "platform/linux/unicode.h"

#include <bit>
#include <cstring>
#include <string_view>
#include <utility>

#include <endian.h>

namespace typhon {
namespace {

std::uint64_t bigEndian(std::span<const std::uint8_t> bytes)
{
    // What files really have, and what reading them spends its time with.
    if (bytes.size() == 2)
        return static_cast<std::uint64_t>(bytes[0] << 8 | bytes[1]);
    if (bytes.size() == 4) {
        std::uint32_t value = 0;
        std::memcpy(&value, bytes.data(), sizeof value);
        return be32toh(value);
    }
    std::uint64_t value = 0;
    for (const auto byte : bytes)
        value = value << 8 | byte;
    return value;
}

}  // namespace

bool BinaryPropertyListObjects::refuse(const char* reason, std::size_t offset)
{
    if (error_.empty())
        error_ = "offset " + std::to_string(offset) + ": " + reason;
    return false;
}

bool BinaryPropertyListObjects::readTrailer(std::size_t mostObjects)
{
    if (bytes_.size() < sizeof binaryPropertyListMagic + binaryPropertyListTrailerSize)
        return refuse("the input is too short", bytes_.size());
    const auto end = bytes_.size() - binaryPropertyListTrailerSize;
    const auto trailer = bytes_.subspan(end);
    offsetSize_ = trailer[6];
    referenceSize_ = trailer[7];
    if (offsetSize_ < 1 || offsetSize_ > 8)
        return refuse("impossible size of offsets", end + 6);
    if (referenceSize_ < 1 || referenceSize_ > 8)
        return refuse("impossible size of references", end + 7);
    return checkTrailer(end, bigEndian(trailer.subspan(8, 8)), bigEndian(trailer.subspan(16, 8)),
                        bigEndian(trailer.subspan(24, 8)), mostObjects);
}

bool BinaryPropertyListObjects::checkTrailer(std::size_t end, std::uint64_t objects, std::uint64_t top,
                                             std::uint64_t table, std::size_t mostObjects)
{
    if (objects == 0)
        return refuse("there is no object", end + 8);
    if (objects > mostObjects)
        return refuse("too many objects", end + 8);
    if (top >= objects)
        return refuse("the top object does not exist", end + 16);
    if (table <= sizeof binaryPropertyListMagic || table > end)
        return refuse("the offset table is out of range", end + 24);
    // Divided, not multiplied: the product may not fit.
    if ((end - table) % offsetSize_ != 0 || (end - table) / offsetSize_ != objects)
        return refuse("the offset table does not fill its place", table);
    count_ = objects;
    top_ = top;
    table_ = table;
    return true;
}

std::optional<BinaryPropertyListObjects::Bytes> BinaryPropertyListObjects::contents(std::size_t offset,
                                                                                    std::size_t size)
{
    if (offset > table_ || size > table_ - offset) {
        refuse("an object reaches beyond the end", offset);
        return std::nullopt;
    }
    return bytes_.subspan(offset, size);
}

bool BinaryPropertyListObjects::takeCount(Head& head)
{
    constexpr auto integerMarker = static_cast<unsigned>(BinaryObjectType::integer);
    const auto marker = contents(head.contents, 1);
    if (!marker)
        return false;
    const unsigned exponent = marker->front() & 0xF;
    if (marker->front() >> 4 != integerMarker || exponent > 3)
        return refuse("a malformed count", head.contents);
    const auto count = contents(head.contents + 1, std::size_t{1} << exponent);
    if (!count)
        return false;
    head.count = bigEndian(*count);
    // Cannot be, and would overflow where it is multiplied.
    if (head.count > bytes_.size())
        return refuse("an object reaches beyond the end", head.offset);
    head.contents += 1 + count->size();
    return true;
}

std::optional<BinaryPropertyListObjects::Head> BinaryPropertyListObjects::head(std::size_t object)
{
    const auto entry = table_ + object * offsetSize_;
    const auto offset = bigEndian(bytes_.subspan(entry, offsetSize_));
    if (offset < sizeof binaryPropertyListMagic || offset >= table_) {
        refuse("an offset is out of range", entry);
        return std::nullopt;
    }
    const auto marker = bytes_[offset];
    const auto detail = static_cast<std::uint8_t>(marker & 0xF);
    Head head{static_cast<BinaryObjectType>(marker >> 4), detail, detail, offset, offset + 1};
    if (head.type >= BinaryObjectType::data && detail == binaryLongCount && !takeCount(head))
        return std::nullopt;
    const std::size_t references = head.type == BinaryObjectType::dictionary ? 2 : 1;
    if (head.isContainer() && !contents(head.contents, head.count * referenceSize_ * references))
        return std::nullopt;
    return head;
}

std::size_t BinaryPropertyListObjects::referenceOffset(const Head& container, std::size_t index) const
{
    return container.contents + index * referenceSize_;
}

std::optional<std::size_t> BinaryPropertyListObjects::reference(const Head& container, std::size_t index)
{
    const auto offset = referenceOffset(container, index);
    const auto object = bigEndian(bytes_.subspan(offset, referenceSize_));
    if (object >= count_) {
        refuse("a reference to an object that does not exist", offset);
        return std::nullopt;
    }
    return object;
}

std::optional<PropertyList> BinaryPropertyListObjects::scalar(const Head& head)
{
    switch (head.type) {
    case BinaryObjectType::constant:
        return constant(head);
    case BinaryObjectType::integer:
        return integer(head);
    case BinaryObjectType::real:
        return real(head);
    case BinaryObjectType::date:
        return date(head);
    case BinaryObjectType::data:
        return data(head);
    case BinaryObjectType::ascii:
    case BinaryObjectType::utf16:
        if (auto string = text(head))
            return std::move(*string);
        return std::nullopt;
    default:
        refuse("an object of a kind that is not supported", head.offset);
        return std::nullopt;
    }
}

std::optional<PropertyList> BinaryPropertyListObjects::constant(const Head& head)
{
    if (head.detail == binaryFalse || head.detail == binaryTrue)
        return head.detail == binaryTrue;
    refuse("an object of a kind that is not supported", head.offset);
    return std::nullopt;
}

/// 128 bits are accepted when they are the sign extension of 64.
std::optional<PropertyList> BinaryPropertyListObjects::integer(const Head& head)
{
    if (head.detail > 4) {
        refuse("an integer of impossible size", head.offset);
        return std::nullopt;
    }
    const auto bytes = contents(head.contents, std::size_t{1} << head.detail);
    if (!bytes)
        return std::nullopt;
    const auto value = std::bit_cast<std::int64_t>(bigEndian(*bytes));
    if (bytes->size() == 16 && bigEndian(bytes->first(8)) != (value < 0 ? ~std::uint64_t{0} : 0)) {
        refuse("an integer beyond 64 bits", head.offset);
        return std::nullopt;
    }
    return value;
}

std::optional<double> BinaryPropertyListObjects::real(const Head& head)
{
    if (head.detail != 2 && head.detail != 3) {
        refuse("a number of impossible size", head.offset);
        return std::nullopt;
    }
    const auto bytes = contents(head.contents, std::size_t{1} << head.detail);
    if (!bytes)
        return std::nullopt;
    if (bytes->size() == 4)
        return std::bit_cast<float>(static_cast<std::uint32_t>(bigEndian(*bytes)));
    return std::bit_cast<double>(bigEndian(*bytes));
}

std::optional<PropertyList> BinaryPropertyListObjects::date(const Head& head)
{
    const auto seconds = real(head);
    if (!seconds)
        return std::nullopt;
    const Date date{*seconds + binaryPropertyListReferenceDate};
    if (head.detail == 3 && isCarried(date))
        return date;
    refuse("a date that is malformed or out of range", head.offset);
    return std::nullopt;
}

std::optional<PropertyList> BinaryPropertyListObjects::data(const Head& head)
{
    const auto bytes = contents(head.contents, head.count);
    if (!bytes)
        return std::nullopt;
    return Data{{bytes->begin(), bytes->end()}};
}

std::optional<std::string> BinaryPropertyListObjects::text(const Head& head)
{
    return head.type == BinaryObjectType::ascii ? ascii(head) : utf16(head);
}

std::optional<std::string> BinaryPropertyListObjects::ascii(const Head& head)
{
    const auto bytes = contents(head.contents, head.count);
    if (!bytes)
        return std::nullopt;
    const std::string_view text(reinterpret_cast<const char*>(bytes->data()), bytes->size());
    if (isAscii(text))
        return std::string(text);
    refuse("text that is not ASCII", head.offset);
    return std::nullopt;
}

std::optional<std::string> BinaryPropertyListObjects::utf16(const Head& head)
{
    const auto bytes = contents(head.contents, head.count * 2);
    if (!bytes)
        return std::nullopt;
    auto text = utf8FromUtf16BigEndian(*bytes);
    if (!text)
        refuse("text that is not valid UTF-16", head.offset);
    return text;
}

}  // namespace typhon
