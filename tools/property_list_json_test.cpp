#include "tools/date_text.h"
#include "tools/property_list_json.h"
#include "tools/typed_value.h"

#include <cmath>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

std::string line(const PropertyList& value)
{
    return jsonOf(value).dump();
}

TEST(PropertyListJson, WritesEveryKind)
{
    EXPECT_EQ(line(true), "true");
    EXPECT_EQ(line(std::int64_t{-9007199254740993}), "-9007199254740993");
    EXPECT_EQ(line(5.0), "5.0");
    EXPECT_EQ(line("a\"b"), R"("a\"b")");
    EXPECT_EQ(line(Data{{0, 255, 1}}), R"("AP8B")");
    EXPECT_EQ(line(Date{0}), R"("1970-01-01T00:00:00Z")");
    EXPECT_EQ(line(Array{1, "two"}), R"([1,"two"])");
    EXPECT_EQ(line(Dictionary{{"b", 1}, {"a", Array{}}}), R"({"a":[],"b":1})");
}

TEST(PropertyListJson, WritesRealsThatJsonLacksAsText)
{
    EXPECT_EQ(line(std::nan("")), R"("nan")");
    EXPECT_EQ(line(HUGE_VAL), R"("inf")");
    EXPECT_EQ(line(-HUGE_VAL), R"("-inf")");
}

TEST(PropertyListJson, ReadsWhatItWrote)
{
    const PropertyList value =
        Dictionary{{"a", Array{1, 2.5, true, "text"}}, {"b", Dictionary{{"c", std::int64_t{1} << 62}}}};
    EXPECT_EQ(propertyListFromJson(line(value)), value);
}

TEST(PropertyListJson, RefusesWhatAPropertyListCannotHold)
{
    EXPECT_FALSE(propertyListFromJson("null"));
    EXPECT_FALSE(propertyListFromJson("[1, null]"));
    EXPECT_FALSE(propertyListFromJson("18446744073709551615"));
    EXPECT_FALSE(propertyListFromJson(R"({"a": 1, "a": 2})"));
    EXPECT_FALSE(propertyListFromJson("[1"));
    EXPECT_FALSE(propertyListFromJson("1 2"));
    EXPECT_FALSE(propertyListFromJson(""));
    EXPECT_FALSE(propertyListFromJson(std::string(200, '[') + std::string(200, ']')));
    EXPECT_TRUE(propertyListFromJson(std::string(100, '[') + std::string(100, ']')));
}

TEST(DateText, IsUtcWithAFractionOnlyWhereThereIsOne)
{
    EXPECT_EQ(dateText(Date{1767225600}), "2026-01-01T00:00:00Z");
    EXPECT_EQ(dateText(Date{-0.5}), "1969-12-31T23:59:59.500000Z");
    EXPECT_EQ(dateText(Date{0.9999999}), "1970-01-01T00:00:01Z");
}

TEST(TypedValue, TakesJsonForWhatItIsAndOtherTextForText)
{
    EXPECT_EQ(typedValue("12", ""), PropertyList(12));
    EXPECT_EQ(typedValue("0.5", ""), PropertyList(0.5));
    EXPECT_EQ(typedValue("true", ""), PropertyList(true));
    EXPECT_EQ(typedValue("\"12\"", ""), PropertyList("12"));
    EXPECT_EQ(typedValue("[\"a\"]", ""), PropertyList(Array{"a"}));
    EXPECT_EQ(typedValue("some text", ""), PropertyList("some text"));
    EXPECT_EQ(typedValue("", ""), PropertyList(""));
}

TEST(TypedValue, RefusesBrokenJsonRatherThanTakingItForText)
{
    EXPECT_FALSE(typedValue("{\"a\": }", ""));
    EXPECT_FALSE(typedValue("[1", ""));
    EXPECT_FALSE(typedValue("\"open", ""));
}

TEST(TypedValue, ReadsTheGivenType)
{
    EXPECT_EQ(typedValue("5", "real"), PropertyList(5.0));
    EXPECT_EQ(typedValue("5", "integer"), PropertyList(5));
    EXPECT_EQ(typedValue("5", "string"), PropertyList("5"));
    EXPECT_EQ(typedValue("true", "boolean"), PropertyList(true));
    EXPECT_EQ(typedValue("AP8B", "data"), PropertyList(Data{{0, 255, 1}}));
    EXPECT_EQ(typedValue("1970-01-01T00:00:01Z", "date"), PropertyList(Date{1}));
    EXPECT_EQ(typedValue("{}", "json"), PropertyList());
}

TEST(TypedValue, RefusesTextThatIsNotOfTheGivenType)
{
    EXPECT_FALSE(typedValue("5.5", "integer"));
    EXPECT_FALSE(typedValue("99999999999999999999", "integer"));
    EXPECT_FALSE(typedValue("5x", "real"));
    EXPECT_FALSE(typedValue("1", "boolean"));
    EXPECT_FALSE(typedValue("text", "json"));
    EXPECT_FALSE(typedValue("A*==", "data"));
    EXPECT_FALSE(typedValue("2026-01-01", "date"));
}

}  // namespace
}  // namespace typhon
