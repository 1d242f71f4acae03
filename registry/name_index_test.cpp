#include "registry/name_index.h"

#include <map>
#include <random>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;

std::vector<std::string> pathsOf(const NameIndex& index, std::string_view name)
{
    std::vector<std::string> paths;
    for (const auto* entry : index.entries(name)) {
        paths.push_back(entry->first);
    }
    return paths;
}

TEST(NameIndex, AnEmptyIndexKnowsNoName)
{
    const NameIndex index(0);
    EXPECT_EQ(index.find(""), nullptr);
    EXPECT_EQ(index.find("Alpha"), nullptr);
    EXPECT_TRUE(index.entries("Alpha").empty());
}

TEST(NameIndex, TheFirstEntryDecidesWhatIsSaidOfAName)
{
    const Dictionary entries{{"/a", 1}, {"/b", 2}};
    NameIndex index(1);
    index.add({"Alpha-Regular", "Alpha", false}, *entries.find("/a"));
    index.add({"Alpha-Regular", "Beta", true}, *entries.find("/b"));
    ASSERT_NE(index.find("Alpha-Regular"), nullptr);
    EXPECT_EQ(index.find("Alpha-Regular")->familyName, "Alpha");
    EXPECT_FALSE(index.find("Alpha-Regular")->isEnabled);
    EXPECT_EQ(pathsOf(index, "Alpha-Regular"), (std::vector<std::string>{"/a", "/b"}));
}

TEST(NameIndex, AnEntryStandsOnceUnderANameHoweverOftenItCarriesIt)
{
    const Dictionary entries{{"/a", 1}, {"/b", 2}};
    NameIndex index(1);
    index.add({"Alpha", "Alpha", true}, *entries.find("/a"));
    index.add({"Alpha", "Alpha", true}, *entries.find("/a"));
    index.add({"Alpha", "Alpha", true}, *entries.find("/b"));
    EXPECT_EQ(pathsOf(index, "Alpha"), (std::vector<std::string>{"/a", "/b"}));
}

TEST(NameIndex, TheEmptyNameIsANameLikeAnyOther)
{
    const Dictionary entries{{"/a", 1}};
    NameIndex index(1);
    index.add({"", "", true}, *entries.begin());
    EXPECT_NE(index.find(""), nullptr);
    EXPECT_EQ(index.find("a"), nullptr);
}

TEST(NameIndex, ManyMoreNamesThanExpectedAreAllFound)
{
    std::mt19937_64 random(3);
    Dictionary entries;
    for (int count = 0; count < 3000; ++count) {
        entries.emplace("/" + std::to_string(random() % 100'000), "name " + std::to_string(random() % 2000));
    }
    NameIndex index(0);
    std::map<std::string, std::vector<std::string>> expected;
    for (const auto& entry : entries) {
        index.add({*entry.second.asString(), {}, true}, entry);
        expected[*entry.second.asString()].push_back(entry.first);
    }
    for (int number = 0; number < 2000; ++number) {
        const auto name = "name " + std::to_string(number);
        EXPECT_EQ(pathsOf(index, name), expected[name]);
    }
}

}  // namespace
}  // namespace typhon
