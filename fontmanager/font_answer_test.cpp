#include "fontmanager/font_answer.h"
#include "platform/linux/property_list_writer.h"
#include "platform/property_list.h"

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

constexpr FontLimits limits{.bytes = 1000, .faces = 3, .nameBytes = 10};
constexpr const char* nonsense = "the font reader gave an answer that makes no sense";

FontNamesReading decoded(const PropertyList& answer)
{
    return decodeFontAnswer(writeBinaryPropertyList(answer), limits);
}

PropertyList names(const PropertyList::Dictionary& familyNames)
{
    return PropertyList::Dictionary{{"Names", familyNames}};
}

TEST(FontAnswer, CarriesNamesAndErrors)
{
    const FontNamesReading two{.familyNames = std::map<std::string, std::string>{{"A", "B"}, {"C", "\u00e9"}},
                               .error = {}};
    EXPECT_EQ(decodeFontAnswer(encodeFontAnswer(two), limits).familyNames, two.familyNames);
    const FontNamesReading none{.familyNames = {}, .error = "not good"};
    EXPECT_EQ(decodeFontAnswer(encodeFontAnswer(none), limits).error, "not good");
    EXPECT_EQ(decodeFontAnswer(encodeFontAnswer(none), limits).familyNames, none.familyNames);
}

TEST(FontAnswer, NamesThatNoFontCouldGiveAreAnError)
{
    EXPECT_TRUE(decoded(names({{"A", "B"}})).familyNames);
    EXPECT_EQ(decoded(names({})).error, nonsense);
    EXPECT_EQ(decoded(names({{"A", 1}})).error, nonsense);
    EXPECT_EQ(decoded(names({{"A", ""}})).error, nonsense);
    EXPECT_EQ(decoded(names({{"", "B"}})).error, nonsense);
    EXPECT_EQ(decoded(names({{"A B", "B"}})).error, nonsense);
    EXPECT_EQ(decoded(names({{"\u00e9", "B"}})).error, nonsense);
    EXPECT_EQ(decoded(names({{"A", "B\nC"}})).error, nonsense);
    EXPECT_EQ(decoded(names({{"A", "elevenbytes"}})).error, nonsense);
    EXPECT_EQ(decoded(names({{"elevenbytes", "B"}})).error, nonsense);
    EXPECT_EQ(decoded(names({{"A", "B"}, {"C", "B"}, {"D", "B"}, {"E", "B"}})).error, nonsense);
}

TEST(FontAnswer, WhatIsNoAnswerIsAnError)
{
    EXPECT_EQ(decodeFontAnswer({}, limits).error, nonsense);
    EXPECT_EQ(decodeFontAnswer(std::vector<std::uint8_t>(100, 'x'), limits).error, nonsense);
    EXPECT_EQ(decoded("Error").error, nonsense);
    EXPECT_EQ(decoded(PropertyList::Dictionary{}).error, nonsense);
    EXPECT_EQ(decoded(PropertyList::Dictionary{{"Error", ""}}).error, nonsense);
    EXPECT_EQ(decoded(PropertyList::Dictionary{{"Error", 1}}).error, nonsense);
    EXPECT_EQ(decoded(PropertyList::Dictionary{{"Error", "E"}, {"Names", PropertyList::Dictionary{}}}).error,
              nonsense);
}

TEST(FontAnswer, AnErrorIsOneShortLine)
{
    EXPECT_EQ(decoded(PropertyList::Dictionary{{"Error", "a\nb"}}).error, "a\\nb");
    EXPECT_EQ(decoded(PropertyList::Dictionary{{"Error", std::string(1000, 'x')}}).error,
              std::string(400, 'x') + "... [600 bytes more]");
}

TEST(FontAnswer, TheLargestReadingFits)
{
    std::map<std::string, std::string> most;
    std::string longest = "\u00e9";
    longest.resize(limits.nameBytes, 'x');
    for (int face = 0; face < limits.faces; ++face) {
        most.emplace(std::to_string(face) + std::string(limits.nameBytes - 1, 'y'), longest);
    }
    const auto answer = encodeFontAnswer({.familyNames = most, .error = {}});
    EXPECT_LE(answer.size(), largestFontAnswer(limits));
    EXPECT_EQ(decodeFontAnswer(answer, limits).familyNames, most);
}

}  // namespace
}  // namespace typhon
