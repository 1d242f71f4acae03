#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"

#include <cmath>
#include <limits>
#include <string>

#include <gmock/gmock.h>

namespace typhon {
namespace {

using testing::HasSubstr;
using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;
using Bytes = std::vector<std::uint8_t>;

PropertyListReading readText(const std::string& text)
{
    return readPropertyList({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
}

void expectBothFormsCarry(const PropertyList& value)
{
    const auto binary = readPropertyList(writeBinaryPropertyList(value));
    ASSERT_TRUE(binary.value) << binary.error;
    EXPECT_EQ(*binary.value, value);
    const auto text = writeXmlPropertyList(value);
    const auto xml = readText(text);
    ASSERT_TRUE(xml.value) << xml.error << "\n" << text;
    EXPECT_EQ(*xml.value, value) << text;
}

PropertyList nestedArrays(std::size_t depth)
{
    PropertyList value(Array{});
    for (std::size_t level = 1; level < depth; ++level)
        value = Array{value};
    return value;
}

TEST(PropertyListWriterTest, CarriesEveryKind)
{
    expectBothFormsCarry(Dictionary{{"boolean", Array{true, false}},
                                    {"integer", 42},
                                    {"real", 2.5},
                                    {"string", "text"},
                                    {"data", Data{{0, 1, 255}}},
                                    {"date", Date{1704164645}},
                                    {"empty", Array{Array{}, Dictionary{}, "", Data{}}}});
    expectBothFormsCarry("alone");
}

TEST(PropertyListWriterTest, CarriesIntegersOfEveryWidth)
{
    Array integers;
    for (int bits = 0; bits < 63; ++bits) {
        const auto power = std::int64_t{1} << bits;
        for (const auto integer : {power - 1, power, power + 1, -power, -power - 1})
            integers.emplace_back(integer);
    }
    integers.emplace_back(std::numeric_limits<std::int64_t>::max());
    integers.emplace_back(std::numeric_limits<std::int64_t>::min());
    expectBothFormsCarry(integers);
}

TEST(PropertyListWriterTest, CarriesRealsExactly)
{
    using Limits = std::numeric_limits<double>;
    expectBothFormsCarry(Array{0.0, -0.0, 0.1, 1e300, -1e-300, 1.0 / 3, 1e22, Limits::max(), Limits::min(),
                               Limits::denorm_min(), Limits::infinity(), -Limits::infinity(),
                               Limits::quiet_NaN(), -Limits::quiet_NaN()});
}

TEST(PropertyListWriterTest, CarriesTextOfEveryPlane)
{
    expectBothFormsCarry(Dictionary{
        {"\xC3\xA4", "\xE2\x82\xAC"}, {"\xF0\x9F\x98\x80", "a\xF4\x8F\xBF\xBF"}, {"", "\xEF\xBF\xBD"}});
}

TEST(PropertyListWriterTest, CarriesTextThatXmlCouldMisread)
{
    expectBothFormsCarry(Dictionary{{"<&>\"'", "]]>"}, {" a\tb\nc ", "\r\n\r"}, {"&amp;", "<!-- -->"}});
}

TEST(PropertyListWriterTest, CarriesDatesBeforeTheEpochAndFarAway)
{
    expectBothFormsCarry(Array{Date{0}, Date{-1}, Date{978307200}, Date{-62135596800}, Date{-62135596801},
                               Date{253402300800}, Date{9007199254740992}, Date{-9007199254740992}});
}

TEST(PropertyListWriterTest, CarriesDataAndTextAroundEveryCountLimit)
{
    Array values;
    for (const std::size_t size :
         {0u, 1u, 2u, 3u, 14u, 15u, 16u, 56u, 57u, 58u, 255u, 256u, 65535u, 65536u}) {
        values.emplace_back(Data{Bytes(size, 0xA5)});
        values.emplace_back(std::string(size, 'x'));
    }
    expectBothFormsCarry(values);
    for (const std::size_t size : {14u, 15u, 255u, 256u, 65536u}) {
        Array elements;
        for (std::size_t index = 0; index < size; ++index)
            elements.emplace_back(static_cast<std::int64_t>(index));
        expectBothFormsCarry(elements);
    }
}

TEST(PropertyListWriterTest, CarriesTheDeepestValueThatIsRead)
{
    expectBothFormsCarry(nestedArrays(PropertyListLimits{}.depth));
}

TEST(PropertyListWriterTest, WritesVeryDeepValuesWithoutDeepRecursion)
{
    const auto deep = nestedArrays(200'000);
    const PropertyListLimits limits{.depth = 200'000};
    EXPECT_EQ(readPropertyList(writeBinaryPropertyList(deep), limits).value, deep);
    const auto text = writeXmlPropertyList(deep);
    EXPECT_EQ(
        readPropertyList({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()}, limits).value,
        deep);
}

TEST(PropertyListWriterTest, EqualValuesGiveEqualBytes)
{
    const PropertyList shared(Array{"once", Array{1}});
    const Array sharing{shared, shared};
    const Array unshared{Array{"once", Array{1}}, Array{"once", Array{1}}};
    ASSERT_EQ(PropertyList(sharing), PropertyList(unshared));
    EXPECT_EQ(writeBinaryPropertyList(sharing), writeBinaryPropertyList(unshared));
    EXPECT_EQ(writeXmlPropertyList(sharing), writeXmlPropertyList(unshared));
    EXPECT_EQ(writeBinaryPropertyList(std::nan("")), writeBinaryPropertyList(-std::nan("1")));
}

TEST(PropertyListWriterTest, BinaryFormHoldsEqualScalarsOnce)
{
    const std::string text(1000, 'x');
    EXPECT_LT(writeBinaryPropertyList(Array{text, text, Dictionary{{text, text}}}).size(), 1200u);
    EXPECT_LT(writeBinaryPropertyList(Array{Data{Bytes(1000)}, Data{Bytes(1000)}}).size(), 1200u);
    // Equal bits of different kinds stay apart.
    expectBothFormsCarry(Array{"x", Data{{'x'}}, 1, true, 0, false, 0.0, "", Data{}});
}

TEST(PropertyListWriterTest, BinaryFormIsAsDocumented)
{
    const Bytes expected{'b', 'p', 'l', 'i', 's', 't', '0', '0', 0xD1, 1, 2, 0x51, 'k', 0x61, 0, 0xE4, 8,
                         11,  13,  0,   0,   0,   0,   0,   0,   1,    1, 0, 0,    0,   0,    0, 0,    0,
                         3,   0,   0,   0,   0,   0,   0,   0,   0,    0, 0, 0,    0,   0,    0, 0,    16};
    EXPECT_EQ(writeBinaryPropertyList(Dictionary{{"k", "\xC3\xA4"}}), expected);
}

TEST(PropertyListWriterTest, XmlFormIsAsDocumented)
{
    const PropertyList value(
        Dictionary{{"a", Array{1, true}}, {"d", Data{{1, 2, 3, 4}}}, {"e", Dictionary{}}});
    EXPECT_EQ(writeXmlPropertyList(value), "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
                                           "<!DOCTYPE plist>\n"
                                           "<plist version=\"1.0\">\n"
                                           "<dict>\n"
                                           "\t<key>a</key>\n"
                                           "\t<array>\n"
                                           "\t\t<integer>1</integer>\n"
                                           "\t\t<true/>\n"
                                           "\t</array>\n"
                                           "\t<key>d</key>\n"
                                           "\t<data>\n"
                                           "\tAQIDBA==\n"
                                           "\t</data>\n"
                                           "\t<key>e</key>\n"
                                           "\t<dict/>\n"
                                           "</dict>\n"
                                           "</plist>\n");
}

TEST(PropertyListWriterTest, XmlFormReplacesWhatItCannotCarry)
{
    const std::string text("a\0b\x01\xEF\xBF\xBF", 7);
    EXPECT_EQ(readText(writeXmlPropertyList(text)).value, PropertyList("a\xEF\xBF\xBD"
                                                                       "b\xEF\xBF\xBD\xEF\xBF\xBD"));
    EXPECT_EQ(readPropertyList(writeBinaryPropertyList(text)).value, PropertyList(text));
}

TEST(PropertyListWriterTest, InvalidUtf8IsReplacedByteByByte)
{
    const PropertyList replaced("a\xEF\xBF\xBD\xEF\xBF\xBD"
                                "b");
    EXPECT_EQ(readPropertyList(writeBinaryPropertyList("a\xE2\x82"
                                                       "b"))
                  .value,
              replaced);
    EXPECT_EQ(readText(writeXmlPropertyList("a\xE2\x82"
                                            "b"))
                  .value,
              replaced);
}

TEST(PropertyListWriterTest, KeysThatCoincideOnceReplacedLeaveAReadableValue)
{
    const PropertyList written(Dictionary{{"\x01", 1}, {"\xEF\xBF\xBD", 2}, {"\xFF", 3}, {"other", 4}});
    const PropertyList inXml(Dictionary{{"\xEF\xBF\xBD", 2}, {"other", 4}});
    EXPECT_EQ(readText(writeXmlPropertyList(written)).value, inXml);
    const PropertyList inBinary(Dictionary{{"\x01", 1}, {"\xEF\xBF\xBD", 2}, {"other", 4}});
    EXPECT_EQ(readPropertyList(writeBinaryPropertyList(written)).value, inBinary);
}

TEST(PropertyListWriterTest, DatesThatCannotBeCarriedAreMovedToTheNearest)
{
    const Array written{Date{1e300}, Date{-std::numeric_limits<double>::infinity()}, Date{std::nan("")}};
    const PropertyList nearest(Array{Date{9007199254740992}, Date{-9007199254740992}, Date{0}});
    EXPECT_EQ(readPropertyList(writeBinaryPropertyList(written)).value, nearest);
    EXPECT_EQ(readText(writeXmlPropertyList(written)).value, nearest);
}

TEST(PropertyListWriterTest, OnlyTheBinaryFormKeepsFractionsOfASecond)
{
    EXPECT_EQ(readPropertyList(writeBinaryPropertyList(Date{1.5})).value, PropertyList(Date{1.5}));
    EXPECT_EQ(readText(writeXmlPropertyList(Date{1.5})).value, PropertyList(Date{1}));
    EXPECT_EQ(readText(writeXmlPropertyList(Date{-1.5})).value, PropertyList(Date{-2}));
}

TEST(PropertyListWriterTest, BinaryFormOfManyObjectsUsesWiderReferencesAndOffsets)
{
    Array values;
    for (int index = 0; index < 70'000; ++index)
        values.emplace_back(index);
    const auto bytes = writeBinaryPropertyList(values);
    EXPECT_EQ(bytes[bytes.size() - 26], 4);
    EXPECT_EQ(bytes[bytes.size() - 25], 4);
    EXPECT_EQ(readPropertyList(bytes).value, PropertyList(values));
}

}  // namespace
}  // namespace typhon
