#include "tools/agent/missing_fonts_choice.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

PropertyList row(const char* name, PropertyList::Array providers, bool isKnown = true)
{
    PropertyList::Dictionary record{{"displayName", name}, {"providers", std::move(providers)}};
    if (isKnown) {
        record.emplace("uniqueID", std::string("id of ") + name);
    }
    return record;
}

MissingFontsChoice choiceOf(PropertyList::Array rows)
{
    return MissingFontsChoice(PropertyList::Dictionary{{"fonts", std::move(rows)}});
}

PropertyList answered(const char* identifier, const char* provider)
{
    return PropertyList::Dictionary{{"uniqueID", identifier}, {"installProvider", provider}};
}

TEST(MissingFontsChoice, ChoosesNothingByItself)
{
    const auto choice = choiceOf({row("A", {"one"})});
    EXPECT_TRUE(choice.answer().empty());
}

TEST(MissingFontsChoice, AnswersWithTheChosenProviderOfEachRow)
{
    auto choice = choiceOf({row("Unknown", {}, false), row("A", {"two", "one"}), row("B", {"three"})});
    EXPECT_EQ(choice.selected(), 1U);
    choice.nextProvider();
    choice.nextProvider();
    choice.selectNext();
    choice.nextProvider();
    EXPECT_EQ(choice.answer(),
              (PropertyList::Array{answered("id of A", "two"), answered("id of B", "three")}));
}

TEST(MissingFontsChoice, GoesThroughTheProvidersInACircle)
{
    auto choice = choiceOf({row("A", {"one", "two"})});
    choice.previousProvider();
    EXPECT_EQ(choice.rows()[0].chosen, 1U);
    choice.nextProvider();
    EXPECT_EQ(choice.rows()[0].chosen, std::nullopt);
    choice.nextProvider();
    EXPECT_EQ(choice.rows()[0].chosen, 0U);
    choice.previousProvider();
    EXPECT_EQ(choice.rows()[0].chosen, std::nullopt);
}

TEST(MissingFontsChoice, BeginsAtTheFirstRowThatOffersSomethingAndGoesOverAllOfThem)
{
    auto choice = choiceOf({row("Unknown", {"x"}, false), row("A", {"one"}), row("No provider", {})});
    EXPECT_EQ(choice.selected(), 1U);
    choice.selectNext();
    choice.selectNext();
    EXPECT_EQ(choice.selected(), 2U);
    choice.nextProvider();
    choice.previousProvider();
    EXPECT_TRUE(choice.answer().empty());
    choice.selectPrevious();
    choice.selectPrevious();
    choice.selectPrevious();
    EXPECT_EQ(choice.selected(), 0U);
    EXPECT_EQ(choiceOf({}).selected(), std::nullopt);
}

TEST(MissingFontsChoice, WithNothingToChooseEveryKeyChoosesNothing)
{
    auto choice = choiceOf({row("Unknown", {}, false)});
    EXPECT_FALSE(choice.hasChoice());
    choice.selectNext();
    choice.selectPrevious();
    choice.nextProvider();
    choice.previousProvider();
    choice.chooseFirst();
    EXPECT_TRUE(choice.answer().empty());
}

TEST(MissingFontsChoice, ChoosesTheFirstProviderOfEveryRow)
{
    auto choice = choiceOf({row("A", {"two", "one"}), row("Unknown", {}, false)});
    choice.chooseFirst();
    EXPECT_EQ(choice.answer(), PropertyList::Array{answered("id of A", "one")});
}

TEST(MissingFontsChoice, LeavesOutWhatIsMalformed)
{
    const auto choice =
        choiceOf({"text", PropertyList::Dictionary{{"displayName", 3}},
                  PropertyList::Dictionary{{"displayName", "A"}, {"providers", "x"}, {"uniqueID", 1}},
                  PropertyList::Dictionary{
                      {"displayName", "B"}, {"providers", PropertyList::Array{1, "p"}}, {"uniqueID", "B"}}});
    ASSERT_EQ(choice.rows().size(), 2U);
    EXPECT_FALSE(choice.rows()[0].isAvailable());
    EXPECT_EQ(choice.rows()[1].providers, std::vector<std::string>{"p"});
    EXPECT_TRUE(MissingFontsChoice(PropertyList(1)).rows().empty());
    EXPECT_TRUE(MissingFontsChoice(PropertyList::Dictionary{{"fonts", "x"}}).rows().empty());
}

TEST(MissingFontsChoice, ShowsNoMoreRowsThanAnybodyCouldRead)
{
    const PropertyList::Array rows(MissingFontsChoice::mostRows + 1, row("A", {"one"}));
    EXPECT_EQ(choiceOf(rows).rows().size(), MissingFontsChoice::mostRows);
}

}  // namespace
}  // namespace typhon
