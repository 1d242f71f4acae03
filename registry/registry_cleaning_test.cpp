#include "registry/registry_cleaning.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;

const PropertyList alphaEntry = Dictionary{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}};

/// What remains of a registry that holds the given entry and a sound one.
CleanedRegistry cleanedWith(const std::string& path, PropertyList entry)
{
    return cleanRegistry(Dictionary{{"/fonts/X/sound.ttf", alphaEntry}, {path, std::move(entry)}});
}

void expectLeftOut(const std::string& path, PropertyList entry, const std::string& part)
{
    const auto cleaned = cleanedWith(path, std::move(entry));
    EXPECT_EQ(cleaned.root, PropertyList(Dictionary{{"/fonts/X/sound.ttf", alphaEntry}})) << path;
    ASSERT_EQ(cleaned.leftOut.size(), 1U) << path;
    EXPECT_EQ(cleaned.leftOut[0].count, 1U);
    EXPECT_EQ(cleaned.leftOut[0].firstPath, path);
    EXPECT_THAT(cleaned.leftOut[0].reason, testing::HasSubstr(part));
}

void expectKept(const std::string& path, PropertyList entry)
{
    const auto cleaned = cleanedWith(path, entry);
    EXPECT_TRUE(cleaned.leftOut.empty()) << path;
    EXPECT_EQ(*cleaned.root.find(path), entry) << path;
}

TEST(RegistryCleaning, AnEntryThatIsNotADictionaryIsLeftOut)
{
    expectLeftOut("/fonts/X/a.ttf", "text", "not dictionaries");
    expectLeftOut("/fonts/X/a.ttf", PropertyList::Array{}, "not dictionaries");
}

TEST(RegistryCleaning, AFamilyNameThatIsNotADictionaryOfStringsIsLeftOut)
{
    expectLeftOut("/fonts/X/a.ttf", Dictionary{{"familyName", "Alpha"}}, "\"familyName\"");
    expectLeftOut("/fonts/X/a.ttf", Dictionary{{"familyName", Dictionary{{"A", "A"}, {"B", 1}}}},
                  "\"familyName\"");
}

TEST(RegistryCleaning, ADisabledThatIsAStringOrANumberIsLeftOut)
{
    expectLeftOut("/fonts/X/a.ttf", Dictionary{{"disabled", "true"}}, "\"disabled\"");
    expectLeftOut("/fonts/X/a.ttf", Dictionary{{"disabled", 1}}, "\"disabled\"");
    expectLeftOut("/fonts/X/a.ttf", Dictionary{{"disabled", 0.0}}, "\"disabled\"");
}

TEST(RegistryCleaning, APathThatIsNotAbsoluteOrCouldNameAnotherFileIsLeftOut)
{
    for (const std::string path : {"", "fonts/X/a.ttf", "/fonts/../a.ttf", "/fonts/..", "/fonts/./a.ttf",
                                   "/fonts/.", "/..", "/fonts/a\n.ttf", "/fonts/a\x7f.ttf"}) {
        expectLeftOut(path, alphaEntry, "absolute path");
    }
    expectLeftOut(std::string("/fonts/a\0b.ttf", 14), alphaEntry, "absolute path");
}

TEST(RegistryCleaning, DotsWithinNamesAndTextInAnyScriptAreFine)
{
    expectKept("/fonts/X/a..b.ttf", alphaEntry);
    expectKept("/fonts/..X/.hidden.ttf", alphaEntry);
    expectKept("/fonts/X/\xd0\xb0.ttf", alphaEntry);
}

TEST(RegistryCleaning, AnEntryWithoutFamilyNameOrDisabledIsKeptWithItsOtherKeys)
{
    expectKept("/fonts/X/a.ttf", Dictionary{});
    expectKept("/fonts/X/a.ttf", Dictionary{{"disabled", true}, {"other", PropertyList::Array{1, "x"}}});
}

TEST(RegistryCleaning, EachKindIsCountedOnceWithItsFirstPath)
{
    const auto cleaned = cleanRegistry(Dictionary{
        {"/fonts/X/a.ttf", 1},
        {"/fonts/X/b.ttf", 2},
        {"/fonts/X/c.ttf", Dictionary{{"disabled", 1}, {"familyName", 1}}},
        {"/fonts/X/d.ttf", alphaEntry},
    });
    EXPECT_EQ(cleaned.root, PropertyList(Dictionary{{"/fonts/X/d.ttf", alphaEntry}}));
    ASSERT_EQ(cleaned.leftOut.size(), 2U);
    EXPECT_EQ(cleaned.leftOut[0].count, 2U);
    EXPECT_EQ(cleaned.leftOut[0].firstPath, "/fonts/X/a.ttf");
    EXPECT_EQ(cleaned.leftOut[1].count, 1U);
    EXPECT_EQ(cleaned.leftOut[1].firstPath, "/fonts/X/c.ttf");
}

TEST(RegistryCleaning, ASoundRegistryIsNotCopied)
{
    const PropertyList root = Dictionary{{"/fonts/X/a.ttf", alphaEntry}};
    const auto cleaned = cleanRegistry(root);
    EXPECT_EQ(cleaned.root.asDictionary(), root.asDictionary());
}

}  // namespace
}  // namespace typhon
