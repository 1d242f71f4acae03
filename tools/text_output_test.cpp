#include "tools/font_table.h"
#include "tools/ledger_text.h"
#include "tools/property_list_text.h"
#include "tools/table.h"

#include <gmock/gmock.h>

namespace typhon {
namespace {

using testing::HasSubstr;
using testing::Not;
using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

const std::string path = "/var/mobile/Library/UserFonts/FontFiles/org.example.foundry/a.ttf";

Dictionary font(Dictionary names)
{
    return {{"familyName", std::move(names)}};
}

TEST(Table, AlignsItsColumnsByCharacters)
{
    Table table({"A", "B"});
    table.addRow({"\xC3\xA9t\xC3\xA9", "x"});
    table.addRow({"long one", "y"});
    EXPECT_EQ(table.text(), "A         B\n\xC3\xA9t\xC3\xA9       x\nlong one  y\n");
}

TEST(Table, MakesControlCharactersVisible)
{
    Table table({"A"});
    table.addRow({"\x1B[2J\n"});
    EXPECT_THAT(table.text(), Not(HasSubstr("\x1B")));
    EXPECT_EQ(table.rowCount(), 1u);
}

TEST(FontTable, ListsEveryFaceOfACollectionByFamily)
{
    const auto faces = facesIn(Dictionary{{path, font({{"B-Bold", "Beta"}, {"A-Regular", "Alpha"}})}});
    ASSERT_EQ(faces.size(), 2u);
    EXPECT_EQ(faces[0].family, "Alpha");
    EXPECT_EQ(faces[1].postScriptName, "B-Bold");
}

TEST(FontTable, ListsAFileWithoutNamesAndWithMalformedOnes)
{
    EXPECT_EQ(facesIn(Dictionary{{path, Dictionary{}}}).size(), 1u);
    EXPECT_EQ(facesIn(Dictionary{{path, "text"}}).size(), 1u);
    EXPECT_EQ(facesIn(Dictionary{{path, font({{"A", 1}})}}).front().family, "");
    EXPECT_EQ(facesIn("text").size(), 0u);
}

TEST(CheckinText, SaysHowEachFontIsOpenedAndWhichExtensionsCame)
{
    const Data token{{1, 0}};
    auto entry = font({{"Own", "Own"}});
    entry.emplace("data", token);
    const auto text = checkinText(
        Dictionary{{"fontsInfo", Dictionary{{path, entry}, {path + "2", font({})}}}, {"extension", token}});
    EXPECT_THAT(text, HasSubstr("own token"));
    EXPECT_THAT(text, HasSubstr("extension  "));
    EXPECT_THAT(text, HasSubstr("2 font files with 2 faces"));
    EXPECT_THAT(text, HasSubstr("extension: every file in"));
    EXPECT_THAT(text, Not(HasSubstr("hidden")));
}

TEST(CheckinText, OfAnEmptyViewHasNoTable)
{
    EXPECT_EQ(checkinText(Dictionary{{"fontsInfo", Dictionary{}}, {"hide-profilefonts", true}}),
              "0 font files with 0 faces\nExtensions: none\nProfile fonts are hidden from this program.\n");
}

TEST(RegistryText, SaysWhichFontsAreSwitchedOff)
{
    auto off = font({{"Off", "Off"}});
    off.emplace("disabled", true);
    EXPECT_EQ(registryText(Dictionary{{"/a", off}, {"/b", font({{"On", "On"}})}}),
              "Family  PostScript name  State  File\n"
              "Off     Off              off    /a\n"
              "On      On               on     /b\n"
              "\n2 font files with 2 faces\n");
}

TEST(LedgerText, GivesWholePaths)
{
    const auto ledger = expandedLedger(Dictionary{
        {"org.example.writer", Array{"U/x/a.ttf", "A/y/b.ttf", "/else.ttf", 1}}, {"broken", "text"}});
    EXPECT_EQ(ledgerText(ledger), "org.example.writer: 3 files\n"
                                  "  /var/mobile/Library/UserFonts/FontFiles/x/a.ttf\n"
                                  "  /var/mobile/Library/UserFonts/FontAssets/y/b.ttf\n"
                                  "  /else.ttf\n");
}

TEST(LedgerText, OfAnEmptyLedgerSaysSo)
{
    EXPECT_EQ(ledgerText(expandedLedger("text")), "No fonts were issued to any application.\n");
}

TEST(PropertyListText, ShowsEveryKind)
{
    const PropertyList value = Dictionary{
        {"array", Array{1, Array{true}, Dictionary{}}},
        {"data", Data{{1, 2}}},
        {"date", Date{0}},
        {"real", 5.0},
        {"text", "a\nb"},
    };
    EXPECT_EQ(propertyListText(value), "array:\n"
                                       "  - 1\n"
                                       "  -\n"
                                       "    - true\n"
                                       "  - (empty dictionary)\n"
                                       "data: <2 bytes: 01 02>\n"
                                       "date: 1970-01-01T00:00:00Z\n"
                                       "real: 5.0\n"
                                       "text: \"a\\nb\"\n");
    EXPECT_EQ(propertyListText(Array{}), "(empty array)\n");
}

}  // namespace
}  // namespace typhon
