#pragma once

#include "platform/linux/property_list_reader.h"

#include <cstddef>
#include <cstdint>
#include <limits>
#include <optional>
#include <span>
#include <string>

namespace typhon {

/// What every binary property list begins with.
inline constexpr char binaryPropertyListMagic[] = {'b', 'p', 'l', 'i', 's', 't', '0', '0'};
/// What ends it: five unused bytes, a sort version, the sizes of offsets and references, and in eight bytes
/// each the number of objects, the top object and the offset of the offset table.
inline constexpr std::size_t binaryPropertyListTrailerSize = 32;
/// Dates count from 2001-01-01 UTC.
inline constexpr double binaryPropertyListReferenceDate = 978'307'200;

/// The upper half of an object's first byte.
enum class BinaryObjectType : std::uint8_t {
    constant = 0x0,
    integer = 0x1,
    real = 0x2,
    date = 0x3,
    data = 0x4,
    ascii = 0x5,
    utf16 = 0x6,
    array = 0xA,
    dictionary = 0xD,
};

inline constexpr std::uint8_t binaryFalse = 0x8;
inline constexpr std::uint8_t binaryTrue = 0x9;
/// The lower half of the first byte when the count follows as an integer object.
inline constexpr std::uint8_t binaryLongCount = 0xF;

/// The single objects of a binary property list, each claim in it checked before it is used. A function that
/// gives null or false has refused the input, and `error` says why.
class BinaryPropertyListObjects {
public:
    struct Head {
        BinaryObjectType type;
        /// The lower half of the first byte.
        std::uint8_t detail;
        /// Of elements, bytes or code units, for the types that have some.
        std::size_t count;
        /// Of the object, and of its contents.
        std::size_t offset, contents;

        bool isContainer() const
        {
            return type == BinaryObjectType::array || type == BinaryObjectType::dictionary;
        }
        bool isString() const { return type == BinaryObjectType::ascii || type == BinaryObjectType::utf16; }
    };

    /// `bytes` must outlive it.
    explicit BinaryPropertyListObjects(std::span<const std::uint8_t> bytes) : bytes_(bytes) {}

    /// Comes first. Refuses more than `mostObjects`.
    bool readTrailer(std::size_t mostObjects);
    std::size_t count() const noexcept { return count_; }
    std::size_t top() const noexcept { return top_; }

    /// `object` is below `count`. For containers the references are within bounds.
    std::optional<Head> head(std::size_t object);
    /// The number of the object that a container refers to, in the order of its references.
    std::optional<std::size_t> reference(const Head& container, std::size_t index);
    /// Where that reference stands.
    std::size_t referenceOffset(const Head& container, std::size_t index) const;
    /// The value of an object that is no container.
    std::optional<PropertyList> scalar(const Head& head);

    /// The text of a string.
    std::optional<std::string> text(const Head& head);

    /// Records the first reason; always false.
    bool refuse(const char* reason, std::size_t offset);
    const std::string& error() const noexcept { return error_; }

private:
    using Bytes = std::span<const std::uint8_t>;

    bool checkTrailer(std::size_t end, std::uint64_t objects, std::uint64_t top, std::uint64_t table,
                      std::size_t mostObjects);
    std::optional<Bytes> contents(std::size_t offset, std::size_t size);
    bool takeCount(Head& head);
    std::optional<PropertyList> integer(const Head& head);
    std::optional<double> real(const Head& head);
    std::optional<PropertyList> date(const Head& head);
    std::optional<PropertyList> data(const Head& head);
    std::optional<std::string> ascii(const Head& head);
    std::optional<std::string> utf16(const Head& head);
    std::optional<PropertyList> constant(const Head& head);

    const Bytes bytes_;
    std::size_t offsetSize_ = 0;
    std::size_t referenceSize_ = 0;
    std::size_t count_ = 0;
    std::size_t top_ = 0;
    /// Of the offset table, which is also where the objects end.
    std::size_t table_ = 0;
    std::string error_;
};

}  // namespace typhon
