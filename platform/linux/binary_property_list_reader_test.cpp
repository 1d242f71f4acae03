#include "platform/linux/binary_property_list_reader.h"
#include "platform/linux/property_list_writer.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <limits>
#include <string>

#include <gmock/gmock.h>

namespace typhon {
namespace {

using testing::HasSubstr;
using testing::StartsWith;
using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;
using Bytes = std::vector<std::uint8_t>;

/// A file made of the given objects, with a trailer that may be tampered with.
struct File {
    std::vector<Bytes> objects;
    std::uint8_t offsetSize = 2;
    std::uint8_t referenceSize = 1;
    std::uint64_t top = 0;

    Bytes bytes() const
    {
        Bytes bytes{'b', 'p', 'l', 'i', 's', 't', '0', '0'};
        std::vector<std::uint64_t> offsets;
        for (const auto& object : objects) {
            offsets.push_back(bytes.size());
            bytes.insert(bytes.end(), object.begin(), object.end());
        }
        return finished(std::move(bytes), offsets);
    }

    Bytes finished(Bytes bytes, const std::vector<std::uint64_t>& offsets) const
    {
        const auto table = bytes.size();
        for (const auto offset : offsets)
            append(bytes, offset, offsetSize);
        append(bytes, 0, 6);
        bytes.push_back(offsetSize);
        bytes.push_back(referenceSize);
        append(bytes, offsets.size(), 8);
        append(bytes, top, 8);
        append(bytes, table, 8);
        return bytes;
    }

    static void append(Bytes& bytes, std::uint64_t value, std::size_t width)
    {
        for (; width != 0; --width)
            bytes.push_back(width > 8 ? std::uint8_t{0}
                                      : static_cast<std::uint8_t>(value >> (width * 8 - 8)));
    }
};

PropertyListReading read(const Bytes& bytes, const PropertyListLimits& limits = {})
{
    return readPropertyList(bytes, limits);
}

PropertyListReading readObjects(const std::vector<Bytes>& objects, const PropertyListLimits& limits = {})
{
    return read(File{objects}.bytes(), limits);
}

void expectValue(const PropertyListReading& reading, const PropertyList& value)
{
    ASSERT_TRUE(reading.value) << reading.error;
    EXPECT_EQ(*reading.value, value);
}

void expectRefused(const PropertyListReading& reading, const std::string& error)
{
    EXPECT_FALSE(reading.value);
    EXPECT_THAT(reading.error, HasSubstr(error));
}

Bytes joined(Bytes first, const Bytes& second)
{
    first.insert(first.end(), second.begin(), second.end());
    return first;
}

Bytes real(std::uint8_t marker, double value)
{
    Bytes bytes{marker};
    File::append(bytes, std::bit_cast<std::uint64_t>(value), 8);
    return bytes;
}

/// The trailer's field at `fromEnd` bytes before the end, overwritten.
Bytes tampered(Bytes bytes, std::size_t fromEnd, std::uint64_t value, std::size_t width)
{
    Bytes field;
    File::append(field, value, width);
    std::copy(field.begin(), field.end(), bytes.end() - static_cast<std::ptrdiff_t>(fromEnd));
    return bytes;
}

TEST(BinaryPropertyListReaderTest, ReadsIntegersOfEverySize)
{
    constexpr auto most = std::numeric_limits<std::int64_t>::max();
    expectValue(readObjects({{0x10, 0xFF}}), 255);
    expectValue(readObjects({{0x11, 0xFF, 0xFE}}), 65534);
    expectValue(readObjects({{0x12, 0xFF, 0xFF, 0xFF, 0xFF}}), std::int64_t{4294967295});
    expectValue(readObjects({joined({0x13}, Bytes(8, 0xFF))}), -1);
    expectValue(readObjects({joined({0x14}, Bytes(16, 0xFF))}), -1);
    expectValue(readObjects({joined(joined({0x14}, Bytes(8, 0)), joined({0x7F}, Bytes(7, 0xFF)))}), most);
    expectValue(readObjects({joined(joined({0x14}, Bytes(8, 0xFF)), joined({0x80}, Bytes(7, 0)))}),
                -most - 1);
}

TEST(BinaryPropertyListReaderTest, RefusesIntegersBeyond64Bits)
{
    const auto refused = "an integer beyond 64 bits";
    expectRefused(readObjects({joined(joined({0x14}, Bytes(8, 0)), joined({0x80}, Bytes(7, 0)))}), refused);
    expectRefused(readObjects({joined(joined({0x14}, Bytes(8, 0)), Bytes(8, 0xFF))}), refused);
    expectRefused(readObjects({joined(joined({0x14}, Bytes(8, 0xFF)), joined({0x7F}, Bytes(7, 0xFF)))}),
                  refused);
    expectRefused(readObjects({joined({0x14, 1}, Bytes(15, 0))}), refused);
    expectRefused(readObjects({joined({0x15}, Bytes(32, 0))}), "an integer of impossible size");
    expectRefused(readObjects({joined({0x1F}, Bytes(32, 0))}), "an integer of impossible size");
}

TEST(BinaryPropertyListReaderTest, ReadsRealsOfBothSizesAndAnyValue)
{
    expectValue(readObjects({{0x22, 0x40, 0x20, 0, 0}}), 2.5);
    expectValue(readObjects({real(0x23, -0.1)}), -0.1);
    expectValue(readObjects({real(0x23, std::nan(""))}), std::nan(""));
    expectValue(readObjects({real(0x23, std::numeric_limits<double>::infinity())}),
                std::numeric_limits<double>::infinity());
    expectRefused(readObjects({{0x20, 0}}), "a number of impossible size");
    expectRefused(readObjects({joined({0x24}, Bytes(16, 0))}), "a number of impossible size");
}

TEST(BinaryPropertyListReaderTest, ReadsFiniteDates)
{
    expectValue(readObjects({real(0x33, 0)}), Date{978307200});
    expectValue(readObjects({real(0x33, -978307200.5)}), Date{-0.5});
    for (const auto seconds : {std::nan(""), std::numeric_limits<double>::infinity(), -1e300, 1e16})
        expectRefused(readObjects({real(0x33, seconds)}), "a date that is malformed or out of range");
    expectRefused(readObjects({{0x32, 0, 0, 0, 0}}), "a date that is malformed");
}

TEST(BinaryPropertyListReaderTest, ReadsTextAndData)
{
    expectValue(readObjects({{0x52, 'a', 0}}), std::string_view("a\0", 2));
    expectValue(readObjects({{0x62, 0xD8, 0x3D, 0xDE, 0x00}}), "\xF0\x9F\x98\x80");
    expectValue(readObjects({{0x61, 0, 'x'}}), "x");
    expectValue(readObjects({{0x42, 0, 0xFF}}), Data{{0, 0xFF}});
    expectValue(readObjects({{0x5F, 0x10, 2, 'a', 'b'}}), "ab");
    expectValue(readObjects({{0x4F, 0x13, 0, 0, 0, 0, 0, 0, 0, 1, 7}}), Data{{7}});
}

TEST(BinaryPropertyListReaderTest, RefusesInvalidText)
{
    expectRefused(readObjects({{0x51, 0xE4}}), "text that is not ASCII");
    expectRefused(readObjects({{0x61, 0xD8, 0x3D}}), "text that is not valid UTF-16");
    expectRefused(readObjects({{0x61, 0xDE, 0x00}}), "text that is not valid UTF-16");
    expectRefused(readObjects({{0xD1, 1, 2}, {0x61, 0xD8, 0x3D}, {0x09}}), "text that is not valid UTF-16");
}

TEST(BinaryPropertyListReaderTest, RefusesKindsThatDoNotExistHere)
{
    for (const std::uint8_t marker :
         Bytes{0x00, 0x01, 0x07, 0x0A, 0x0C, 0x0F, 0x70, 0x80, 0x90, 0xB0, 0xC0, 0xE0, 0xF0})
        expectRefused(readObjects({{marker, 0, 0}}), "an object of a kind that is not supported");
}

TEST(BinaryPropertyListReaderTest, ReadsContainers)
{
    expectValue(readObjects({{0xA2, 1, 2}, {0x09}, {0x08}}), Array{true, false});
    expectValue(readObjects({{0xD2, 1, 2, 3, 4}, {0x51, 'b'}, {0x51, 'a'}, {0x10, 1}, {0x10, 2}}),
                Dictionary{{"b", 1}, {"a", 2}});
    expectValue(readObjects({{0xA0}}), Array{});
    expectValue(readObjects({{0xD0}}), Dictionary{});
}

TEST(BinaryPropertyListReaderTest, ReadsEverySizeOfOffsetsAndReferences)
{
    for (std::uint8_t size = 1; size <= 8; ++size) {
        File file{{}, size, size};
        Bytes array{0xA2};
        File::append(array, 1, size);
        File::append(array, 1, size);
        file.objects = {array, {0x51, 'x'}};
        expectValue(read(file.bytes()), Array{"x", "x"});
    }
}

TEST(BinaryPropertyListReaderTest, ReadsAnyTopObject)
{
    File file{{{0x09}, {0xA1, 0}}};
    file.top = 1;
    expectValue(read(file.bytes()), Array{true});
}

TEST(BinaryPropertyListReaderTest, RefusesImpossibleTrailers)
{
    const auto bytes = File{{{0xA1, 1}, {0x09}}}.bytes();
    ASSERT_TRUE(read(bytes).value);
    constexpr auto huge = std::numeric_limits<std::uint64_t>::max();
    for (const std::uint64_t size : {0, 9, 255}) {
        expectRefused(read(tampered(bytes, 26, size, 1)), "impossible size of offsets");
        expectRefused(read(tampered(bytes, 25, size, 1)), "impossible size of references");
    }
    expectRefused(read(tampered(bytes, 24, 0, 8)), "there is no object");
    for (const std::uint64_t count : {huge, huge / 2 + 2, huge / 2 + 3})
        expectRefused(read(tampered(bytes, 24, count, 8)), "too many objects");
    for (const std::uint64_t count : {1, 3})
        expectRefused(read(tampered(bytes, 24, count, 8)), "the offset table does not fill its place");
    for (const std::uint64_t top : {std::uint64_t{2}, huge})
        expectRefused(read(tampered(bytes, 16, top, 8)), "the top object does not exist");
    for (const std::uint64_t table :
         {std::uint64_t{0}, std::uint64_t{8}, std::uint64_t{bytes.size() - 31}, huge})
        expectRefused(read(tampered(bytes, 8, table, 8)), "the offset table is out of range");
    for (const std::uint64_t table : {9, 13})
        expectRefused(read(tampered(bytes, 8, table, 8)), "the offset table does not fill its place");
}

TEST(BinaryPropertyListReaderTest, RefusesCountsThatOverflowInTheTrailer)
{
    // A product of count and size that wraps to the size of the table.
    File file{{{0x09}}, 8};
    constexpr std::uint64_t wrapping = (std::uint64_t{1} << 61) + 1;
    const PropertyListLimits unlimited{.values = std::numeric_limits<std::size_t>::max()};
    expectRefused(read(tampered(file.bytes(), 24, wrapping, 8), unlimited), "too many objects");
    constexpr std::uint64_t many = std::uint64_t{1} << 31;
    expectRefused(read(tampered(file.bytes(), 24, many, 8), unlimited), "does not fill its place");
}

TEST(BinaryPropertyListReaderTest, RefusesOffsetsOutsideTheObjects)
{
    const File file{{}, 8};
    Bytes start{'b', 'p', 'l', 'i', 's', 't', '0', '0', 0x09};
    expectValue(read(file.finished(start, {8})), true);
    for (const std::uint64_t offset :
         {std::uint64_t{0}, std::uint64_t{7}, std::uint64_t{9}, std::uint64_t{100}, ~std::uint64_t{0}})
        expectRefused(read(file.finished(start, {offset})), "an offset is out of range");
}

TEST(BinaryPropertyListReaderTest, RefusesObjectsThatReachBeyondTheirEnd)
{
    const auto refused = "an object reaches beyond the end";
    for (const Bytes& object : std::vector<Bytes>{{0x10},
                                                  {0x13, 0, 0},
                                                  {0x22, 0},
                                                  {0x23},
                                                  {0x33, 1},
                                                  {0x42, 0},
                                                  {0x53, 'a', 'b'},
                                                  {0x61, 0},
                                                  {0xA1},
                                                  {0xD1, 0},
                                                  {0x5F},
                                                  {0x5F, 0x11, 0},
                                                  {0x5F, 0x10, 200, 'a'},
                                                  {0x6F, 0x12, 0x80, 0, 0, 0},
                                                  {0xAF, 0x10, 9}})
        expectRefused(readObjects({object}), refused);
    // Counts whose product with a size wraps around.
    for (const std::uint64_t count :
         {~std::uint64_t{0}, std::uint64_t{1} << 63, (std::uint64_t{1} << 61) + 1}) {
        for (const std::uint8_t marker : Bytes{0x4F, 0x5F, 0x6F, 0xAF, 0xDF}) {
            Bytes object{marker, 0x13};
            File::append(object, count, 8);
            expectRefused(readObjects({joined(object, Bytes(20, 0))}), refused);
        }
    }
}

TEST(BinaryPropertyListReaderTest, RefusesMalformedCounts)
{
    for (const std::uint8_t marker : Bytes{0x14, 0x1F, 0x22, 0x09, 0x51})
        expectRefused(readObjects({joined({0x5F, marker}, Bytes(20, 0))}), "a malformed count");
}

TEST(BinaryPropertyListReaderTest, RefusesReferencesToNoObject)
{
    expectRefused(readObjects({{0xA1, 2}, {0x09}}), "a reference to an object that does not exist");
    expectRefused(readObjects({{0xD1, 9, 1}, {0x09}}), "a reference to an object that does not exist");
}

TEST(BinaryPropertyListReaderTest, RefusesCycles)
{
    const auto refused = "a container contains itself";
    expectRefused(readObjects({{0xA1, 0}}), refused);
    expectRefused(readObjects({{0xA1, 1}, {0xA1, 0}}), refused);
    expectRefused(readObjects({{0xD1, 1, 0}, {0x51, 'k'}}), refused);
    expectRefused(readObjects({{0xA2, 1, 2}, {0x09}, {0xD1, 3, 0}, {0x51, 'k'}}), refused);
}

TEST(BinaryPropertyListReaderTest, RefusesKeysThatAreNotStrings)
{
    for (const Bytes& key : std::vector<Bytes>{{0x10, 1}, {0x09}, {0x41, 'k'}, {0xA0}, {0xD0}})
        expectRefused(readObjects({{0xD1, 1, 2}, key, {0x09}}), "a key that is not a string");
    expectRefused(readObjects({{0xD1, 0, 1}, {0x09}}), "a key that is not a string");
    // Also where it has been read before, as a value.
    expectRefused(readObjects({{0xA2, 1, 2}, {0x10, 1}, {0xD1, 1, 1}}), "a key that is not a string");
}

TEST(BinaryPropertyListReaderTest, RefusesDuplicateKeys)
{
    expectRefused(readObjects({{0xD2, 1, 1, 2, 2}, {0x51, 'k'}, {0x09}}), "a duplicate key");
    expectRefused(readObjects({{0xD2, 1, 2, 3, 3}, {0x51, 'k'}, {0x61, 0, 'k'}, {0x09}}), "a duplicate key");
}

TEST(BinaryPropertyListReaderTest, SharesWhatIsReferencedSeveralTimes)
{
    const auto reading = readObjects({{0xA2, 1, 1}, {0xA1, 2}, {0x51, 'x'}});
    expectValue(reading, Array{Array{"x"}, Array{"x"}});
    const auto& elements = *reading.value->asArray();
    EXPECT_EQ(elements[0].asArray(), elements[1].asArray());
}

/// Arrays of ten references each to the next one; the innermost is a string.
std::vector<Bytes> tower(std::uint8_t height)
{
    std::vector<Bytes> objects;
    for (std::uint8_t level = 1; level <= height; ++level)
        objects.push_back(joined({0xAA}, Bytes(10, level)));
    objects.push_back({0x53, 'h', 'a', '!'});
    return objects;
}

TEST(BinaryPropertyListReaderTest, WhatIsSharedCountsEachTime)
{
    expectRefused(readObjects(tower(50)), "too many values");
    EXPECT_TRUE(readObjects(tower(3), {.values = 1111}).value);
    expectRefused(readObjects(tower(3), {.values = 1110}), "too many values");
    const auto size = File{tower(3)}.bytes().size();
    ASSERT_LT(size, 3000u);
    EXPECT_TRUE(readObjects(tower(3), {.bytes = 3000}).value);
    expectRefused(readObjects(tower(3), {.bytes = 2999}), "too much text and data");
}

TEST(BinaryPropertyListReaderTest, ObjectsThatOverlapCountEachTime)
{
    // Many entries of the offset table for one long text.
    File file{{}, 4, 2};
    Bytes bytes{'b', 'p', 'l', 'i', 's', 't', '0', '0', 0x5F, 0x12};
    constexpr std::uint64_t length = 1u << 20;
    File::append(bytes, length, 4);
    bytes.insert(bytes.end(), length, 'x');
    std::vector<std::uint64_t> offsets(1001, 8);
    offsets[0] = bytes.size();
    bytes.insert(bytes.end(), {0xAF, 0x11, 1000 / 256, 1000 % 256});
    for (std::uint64_t object = 1; object <= 1000; ++object)
        File::append(bytes, object, 2);
    expectRefused(read(file.finished(bytes, offsets)), "too much text and data");
}

TEST(BinaryPropertyListReaderTest, BoundsDepthAlsoThroughSharedObjects)
{
    const std::vector<Bytes> nested{{0xA1, 1}, {0xA1, 2}, {0xA0}};
    EXPECT_TRUE(readObjects(nested, {.depth = 3}).value);
    expectRefused(readObjects(nested, {.depth = 2}), "nested too deeply");
    // Object 1 is read at depth two, then referred to from depth three.
    const std::vector<Bytes> shared{{0xA2, 1, 2}, {0xA1, 4}, {0xA1, 3}, {0xA1, 1}, {0xA0}};
    EXPECT_TRUE(readObjects(shared, {.depth = 5}).value);
    expectRefused(readObjects(shared, {.depth = 4}), "nested too deeply");
}

TEST(BinaryPropertyListReaderTest, CountsValuesAndKeys)
{
    const std::vector<Bytes> objects{{0xD1, 1, 2}, {0x51, 'k'}, {0xA1, 3}, {0x09}};
    EXPECT_TRUE(readObjects(objects, {.values = 4}).value);
    expectRefused(readObjects(objects, {.values = 3}), "too many");
}

TEST(BinaryPropertyListReaderTest, RefusesTruncatedInputAndTrailingGarbage)
{
    const auto bytes = writeBinaryPropertyList(Dictionary{{"a", Array{1, "two", 3.0}}, {"b", Data{{1, 2}}}});
    ASSERT_TRUE(read(bytes).value);
    for (std::size_t length = 0; length < bytes.size(); ++length)
        EXPECT_FALSE(read({bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(length)}).value)
            << length;
    EXPECT_FALSE(read(joined(bytes, {0})).value);
    EXPECT_FALSE(read(joined(bytes, bytes)).value);
    expectRefused(read({'b', 'p', 'l', 'i', 's', 't', '0', '0'}), "the input is too short");
}

TEST(BinaryPropertyListReaderTest, SaysAtWhichOffset)
{
    EXPECT_EQ(readObjects({{0xA1, 1}, {0x51, 0xE4}}).error, "offset 10: text that is not ASCII");
    EXPECT_EQ(readObjects({{0xA1, 7}}).error, "offset 9: a reference to an object that does not exist");
}

TEST(BinaryPropertyListReaderTest, AFlippedByteNeverDoesHarm)
{
    const auto original = writeBinaryPropertyList(Dictionary{
        {"a", Array{1, "two", 3.0, Date{5}, "\xC3\xA4"}}, {"b", Data{{1, 2}}}, {"c", Dictionary{}}});
    std::size_t refused = 0;
    for (std::size_t at = 8; at < original.size(); ++at) {
        for (unsigned value = 0; value < 256; ++value) {
            auto bytes = original;
            bytes[at] = static_cast<std::uint8_t>(value);
            const auto reading = read(bytes, {.values = 1000});
            if (reading.value) {
                EXPECT_EQ(read(writeBinaryPropertyList(*reading.value)).value, reading.value);
            } else {
                EXPECT_THAT(reading.error, StartsWith("offset "));
                ++refused;
            }
        }
    }
    EXPECT_GT(refused, 1000u);
}

}  // namespace
}  // namespace typhon
