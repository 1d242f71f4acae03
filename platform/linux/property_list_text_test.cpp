#include "platform/linux/property_list_text.h"

#include <cmath>
#include <limits>

#include <gtest/gtest.h>

namespace typhon {
namespace {

TEST(PropertyListTextTest, ReadsDecimalAndHexadecimalIntegers)
{
    EXPECT_EQ(integerFromText("0"), 0);
    EXPECT_EQ(integerFromText(" \n+42\t"), 42);
    EXPECT_EQ(integerFromText("-0042"), -42);
    EXPECT_EQ(integerFromText("0x1f"), 31);
    EXPECT_EQ(integerFromText("-0XFF"), -255);
    EXPECT_EQ(integerFromText("9223372036854775807"), std::numeric_limits<std::int64_t>::max());
    EXPECT_EQ(integerFromText("-9223372036854775808"), std::numeric_limits<std::int64_t>::min());
    EXPECT_EQ(integerFromText("-0x8000000000000000"), std::numeric_limits<std::int64_t>::min());
}

TEST(PropertyListTextTest, RefusesIntegersThatAreMalformedOrTooLarge)
{
    for (const auto* text : {"",
                             " ",
                             "-",
                             "+",
                             "0x",
                             "-0x",
                             "1 2",
                             "1.0",
                             "1e3",
                             "0x1g",
                             "--1",
                             "+-1",
                             "-+1",
                             "0x-1",
                             "0x+1",
                             "1-",
                             "12a",
                             "9223372036854775808",
                             "-9223372036854775809",
                             "18446744073709551615",
                             "18446744073709551616",
                             "0xFFFFFFFFFFFFFFFF",
                             "0x8000000000000000",
                             "99999999999999999999999999"})
        EXPECT_FALSE(integerFromText(text)) << text;
    EXPECT_FALSE(integerFromText(std::string_view("1\0", 2)));
}

TEST(PropertyListTextTest, ReadsReals)
{
    EXPECT_EQ(realFromText("1"), 1.0);
    EXPECT_EQ(realFromText(" -2.5e-3\n"), -0.0025);
    EXPECT_EQ(realFromText("+.5"), 0.5);
    EXPECT_EQ(realFromText("5e-324"), std::numeric_limits<double>::denorm_min());
    EXPECT_EQ(realFromText("inf"), std::numeric_limits<double>::infinity());
    EXPECT_EQ(realFromText("-Infinity"), -std::numeric_limits<double>::infinity());
    EXPECT_EQ(realFromText("+infinity"), std::numeric_limits<double>::infinity());
    EXPECT_TRUE(std::isnan(realFromText("NaN").value_or(0)));
    EXPECT_TRUE(std::signbit(realFromText("-0").value_or(1)));
}

TEST(PropertyListTextTest, RefusesMalformedReals)
{
    for (const auto* text :
         {"", "+", "-", "1,5", "1.5x", "0x1p3", "++1", "+-1", "-+1", "1e999", "1 2", "e5", "."})
        EXPECT_FALSE(realFromText(text)) << text;
}

TEST(PropertyListTextTest, WritesTheShortestTextOfAReal)
{
    EXPECT_EQ(textFromReal(0.1), "0.1");
    EXPECT_EQ(textFromReal(-0.0), "-0");
    EXPECT_EQ(textFromReal(1e300), "1e+300");
    EXPECT_EQ(textFromReal(-std::numeric_limits<double>::infinity()), "-inf");
    EXPECT_EQ(textFromReal(std::copysign(std::nan(""), -1.0)), "nan");
    EXPECT_EQ(textFromReal(-std::numeric_limits<double>::denorm_min()), "-5e-324");
}

TEST(PropertyListTextTest, ConvertsKnownDates)
{
    const std::pair<const char*, double> known[] = {
        {"1970-01-01T00:00:00Z", 0},
        {"2001-01-01T00:00:00Z", 978307200},
        {"2024-01-02T03:04:05Z", 1704164645},
        {"2024-02-29T23:59:59Z", 1709251199},
        {"1969-12-31T23:59:59Z", -1},
        {"1900-03-01T00:00:00Z", -2203891200},
        {"0001-01-01T00:00:00Z", -62135596800},
        {"0000-02-29T00:00:00Z", -62162121600},
        {"-0001-12-31T23:59:59Z", -62167219201},
        {"9999-12-31T23:59:59Z", 253402300799},
        {"10000-01-01T00:00:00Z", 253402300800},
    };
    for (const auto& [text, seconds] : known) {
        EXPECT_EQ(dateFromText(text), Date{seconds}) << text;
        EXPECT_EQ(textFromDate({seconds}), text);
    }
    EXPECT_EQ(dateFromText(" 1970-01-01T00:00:00Z\n"), Date{0});
}

TEST(PropertyListTextTest, RefusesDatesThatDoNotExist)
{
    for (const auto* text : {"",
                             "2024-01-02",
                             "2024-01-02T03:04:05",
                             "2024-01-02 03:04:05Z",
                             "2024-01-02T03:04Z",
                             "24-01-02T03:04:05Z",
                             "2024-1-02T03:04:05Z",
                             "2024-13-01T00:00:00Z",
                             "2024-00-01T00:00:00Z",
                             "2024-01-00T00:00:00Z",
                             "2024-01-32T00:00:00Z",
                             "2023-02-29T00:00:00Z",
                             "1900-02-29T00:00:00Z",
                             "2024-04-31T00:00:00Z",
                             "2024-01-02T24:00:00Z",
                             "2024-01-02T03:60:05Z",
                             "2024-01-02T03:04:60Z",
                             "2024-01-02T03:04:05.5Z",
                             "2024-01-02T03:04:05Zx",
                             "2024-01-02T03:04:05+01:00",
                             "+2024-01-02T03:04:05Z",
                             "2024-+1-02T03:04:05Z",
                             "999999999-01-01T00:00:00Z",
                             "2024-01-02T03:04:05ZZ",
                             "9999999999-01-01T00:00:00Z"})
        EXPECT_FALSE(dateFromText(text)) << text;
}

TEST(PropertyListTextTest, EveryDayAroundLeapYearsReadsBack)
{
    constexpr double day = 86400;
    for (double seconds = -80'000'000'000; seconds < 80'000'000'000; seconds += 17 * day + 3661)
        EXPECT_EQ(dateFromText(textFromDate({seconds})), Date{seconds}) << textFromDate({seconds});
}

TEST(PropertyListTextTest, TheFarthestDatesReadBack)
{
    EXPECT_EQ(dateFromText(textFromDate({farthestDate})), Date{farthestDate});
    EXPECT_EQ(dateFromText(textFromDate({-farthestDate})), Date{-farthestDate});
    EXPECT_EQ(textFromDate({1e300}), textFromDate({farthestDate}));
    EXPECT_FALSE(isCarried(Date{std::nan("")}));
    EXPECT_FALSE(isCarried(Date{std::numeric_limits<double>::infinity()}));
}

}  // namespace
}  // namespace typhon
