#include "tools/change_text.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;
using Strings = std::vector<std::string>;

TEST(ChangeText, NamesTheFontsThatCameAsFarAsTheyAreKnown)
{
    const PropertyList entry = Dictionary{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}};
    const FontChangeNotice change{
        Dictionary{{"fontsInfo", Dictionary{{"/a b.ttf", entry}}}, {"extension.provider", Data{{1, 0}}}},
        Strings{"file:///a%20b.ttf", "file:///off.ttf"}, std::nullopt};
    EXPECT_EQ(changeText(change),
              "added 2 font files: /a b.ttf (Alpha / Alpha-Regular); /off.ttf [extension.provider]");
}

TEST(ChangeText, NamesTheFilesThatWent)
{
    EXPECT_EQ(changeText({PropertyList(), std::nullopt, Strings{"file:///a.ttf"}}),
              "removed 1 font file: /a.ttf");
}

TEST(ChangeText, IsOneLineWhateverItWasTold)
{
    const FontChangeNotice change{std::nullopt, Strings{"file:///a%0A%1B[2J", "no url\n"}, std::nullopt};
    EXPECT_EQ(changeText(change).find('\n'), std::string::npos);
    EXPECT_EQ(changeText(change).find('\x1B'), std::string::npos);
    EXPECT_EQ(changeText({}), "a change without fonts");
}

TEST(ChangeJson, KeepsWhatIsNullApartFromWhatIsEmpty)
{
    const auto json = changeJson({PropertyList(), Strings{}, std::nullopt});
    EXPECT_EQ(json.dump(), R"({"addedURLStrings":[],"info":{},"removedURLStrings":null})");
}

}  // namespace
}  // namespace typhon
