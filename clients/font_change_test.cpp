#include "clients/font_change.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

TEST(FontChangeTest, AReportIsReadAsItStands)
{
    const FontChange change(Dictionary{{"urls", Array{"file:///a%20b.ttf"}}, {"added", true}, {"kind", 1}});
    EXPECT_TRUE(change.isAdded());
    EXPECT_FALSE(change.isOfUserFonts());
    ASSERT_EQ(change.fonts().size(), 1U);
    EXPECT_EQ(change.fonts()[0].url, "file:///a%20b.ttf");
    EXPECT_EQ(change.fonts()[0].path, "/a b.ttf");
}

TEST(FontChangeTest, WhatIsMissingOrOfAnotherTypeReadsAsFalseZeroAndNoUrls)
{
    const std::vector<PropertyList> reports{
        Dictionary{},
        Dictionary{{"urls", "file:///a"}, {"added", 1}, {"kind", "1"}},
        Dictionary{{"urls", Dictionary{{"0", "file:///a"}}}, {"added", "true"}, {"kind", 1.0}},
        Dictionary{{"urls", 5}, {"added", Array{}}, {"kind", true}},
        Array{"urls"},
        "report",
        1};
    for (const auto& report : reports) {
        const FontChange change(report);
        EXPECT_FALSE(change.isAdded());
        EXPECT_TRUE(change.isOfUserFonts());
        EXPECT_TRUE(change.fonts().empty());
    }
}

TEST(FontChangeTest, AnyKindButZeroIsOfProfiles)
{
    for (const std::int64_t kind : {std::int64_t{-1}, std::int64_t{2}, INT64_MAX}) {
        EXPECT_FALSE(FontChange(Dictionary{{"kind", kind}}).isOfUserFonts());
    }
    EXPECT_TRUE(FontChange(Dictionary{{"kind", 0}}).isOfUserFonts());
}

TEST(FontChangeTest, WhatIsNoValidUrlIsSkipped)
{
    const FontChange change(Dictionary{{"urls", Array{"file:///a", 7, "not a url", "http:///b", "/c", Array{},
                                                      "file:///%00", "file:///d"}}});
    ASSERT_EQ(change.fonts().size(), 2U);
    EXPECT_EQ(change.fonts()[0].path, "/a");
    EXPECT_EQ(change.fonts()[1].path, "/d");
    EXPECT_EQ(change.leftOut(), 0U);
}

TEST(FontChangeTest, AChangeNamesSoManyFontsAndNoMore)
{
    Array urls(FontChange::mostFonts + 3, "file:///a");
    EXPECT_EQ(FontChange(Dictionary{{"urls", urls}}).fonts().size(), FontChange::mostFonts);
    EXPECT_EQ(FontChange(Dictionary{{"urls", urls}}).leftOut(), 3U);
    urls.resize(FontChange::mostFonts);
    EXPECT_EQ(FontChange(Dictionary{{"urls", urls}}).leftOut(), 0U);
}

TEST(FontChangeTest, TheUrlsOfAChangeAreSoLongAndNoLonger)
{
    const std::string url = "file:///" + std::string(4000, 'a');
    const auto most = FontChange::longestUrls / url.size();
    const FontChange change(Dictionary{{"urls", Array(most + 2, url)}});
    EXPECT_EQ(change.fonts().size(), most);
    EXPECT_EQ(change.leftOut(), 2U);
}

}  // namespace
}  // namespace typhon
