#include "fontmanager/directory_names.h"

#include <set>
#include <string>

#include <gtest/gtest.h>

namespace typhon {
namespace {

TEST(DirectoryNames, LettersDigitsHyphensAndDotsStandForThemselves)
{
    EXPECT_EQ(directoryNameFromIdentifier("com.example.Font-Shop9"), "com.example.Font-Shop9");
    EXPECT_EQ(identifierFromDirectoryName("com.example.Font-Shop9"), "com.example.Font-Shop9");
}

TEST(DirectoryNames, EveryOtherByteIsEscaped)
{
    EXPECT_EQ(directoryNameFromIdentifier("a_b"), "a%5Fb");
    EXPECT_EQ(directoryNameFromIdentifier("a/../b"), "a%2F..%2Fb");
    EXPECT_EQ(directoryNameFromIdentifier("100%"), "100%25");
    EXPECT_EQ(directoryNameFromIdentifier("\xC3\xA9"), "%C3%A9");
    EXPECT_EQ(directoryNameFromIdentifier(std::string_view("a\0b", 3)), "a%00b");
}

TEST(DirectoryNames, EveryByteComesBackAndNoTwoNamesAreEqual)
{
    std::set<std::string> names;
    for (int value = 0; value < 256; ++value) {
        const std::string identifier = std::string("a") + static_cast<char>(value);
        const auto name = directoryNameFromIdentifier(identifier);
        ASSERT_TRUE(name) << value;
        EXPECT_EQ(name->find_first_of(std::string("/\0", 2)), std::string::npos) << value;
        EXPECT_EQ(identifierFromDirectoryName(*name), identifier) << value;
        names.insert(*name);
    }
    EXPECT_EQ(names.size(), 256u);
}

TEST(DirectoryNames, NamesThatMeanOtherDirectoriesAreEscaped)
{
    EXPECT_EQ(directoryNameFromIdentifier("."), "%2E");
    EXPECT_EQ(directoryNameFromIdentifier(".."), "%2E%2E");
    EXPECT_EQ(directoryNameFromIdentifier("..."), "...");
    EXPECT_EQ(identifierFromDirectoryName("%2E"), ".");
    EXPECT_EQ(identifierFromDirectoryName("%2E%2E"), "..");
    EXPECT_EQ(identifierFromDirectoryName("."), std::nullopt);
    EXPECT_EQ(identifierFromDirectoryName(".."), std::nullopt);
}

TEST(DirectoryNames, EmptyAndOverlongIdentifiersHaveNone)
{
    EXPECT_EQ(directoryNameFromIdentifier(""), std::nullopt);
    EXPECT_EQ(directoryNameFromIdentifier(std::string(255, 'a')), std::string(255, 'a'));
    EXPECT_EQ(directoryNameFromIdentifier(std::string(256, 'a')), std::nullopt);
    EXPECT_EQ(directoryNameFromIdentifier(std::string(85, '_'))->size(), 255u);
    EXPECT_EQ(directoryNameFromIdentifier(std::string(86, '_')), std::nullopt);
}

TEST(DirectoryNames, ANameThatIsNotExactlyAnEscapeIsNobodys)
{
    for (const char* name :
         {"", "a_b", "a%5fb", "a%5", "a%", "%41", "%2Ex", "a b", "%GG", "a%2Eb", "\xC3\xA9"}) {
        EXPECT_EQ(identifierFromDirectoryName(name), std::nullopt) << name;
    }
    EXPECT_EQ(identifierFromDirectoryName(std::string(256, 'a')), std::nullopt);
}

}  // namespace
}  // namespace typhon
