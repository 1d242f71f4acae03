#include "tools/agent/dialog_picture.h"
#include "tools/agent/display_text.h"
#include "tools/agent/login_terminals.h"
#include "tools/agent/terminal_keys.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

TEST(DisplayText, ControlCharactersAreMadeVisible)
{
    EXPECT_EQ(displayText("a\x1B[2Jb\nc", 80), "a\\x1B[2Jb\\nc");
    EXPECT_EQ(displayText("\xC2\x9B", 80), "\\u009B");
}

TEST(DisplayText, CharactersThatTurnTheOrderOfOthersAreMadeVisible)
{
    EXPECT_EQ(displayText("a\xE2\x80\xAE"
                          "b",
                          80),
              "a\\u202Eb");
    EXPECT_EQ(displayText("\xE2\x80\x8B", 80), "\\u200B");
}

TEST(DisplayText, IsCutByTheColumnsItTakes)
{
    EXPECT_EQ(displayText("abcdef", 6), "abcdef");
    EXPECT_EQ(displayText("abcdefg", 6), "abc...");
    // Two columns each.
    EXPECT_EQ(displayText("\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E", 6), "\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E");
    EXPECT_EQ(displayText("\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E", 5), "\xE6\x97\xA5...");
    EXPECT_EQ(displayWidth(displayField("\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E", 4)), 4U);
}

TEST(DisplayText, OfAMegabyteIsCutAndAccentsDoNotPileUp)
{
    EXPECT_EQ(displayText(std::string(1 << 20, 'x'), 10), "xxxxxxx...");
    std::string accents = "e";
    for (int count = 0; count < 100; ++count) {
        accents += "\xCC\x81";
    }
    EXPECT_EQ(displayText(accents, 10), "e\xCC\x81\xCC\x81");
}

MissingFontsChoice choiceOf(std::size_t count)
{
    PropertyList::Array rows{
        PropertyList::Dictionary{{"displayName", "Un\x1B[31mknown"}, {"providers", PropertyList::Array{}}}};
    for (std::size_t index = 1; index < count; ++index) {
        const auto name = "Family " + std::to_string(index);
        rows.push_back(PropertyList::Dictionary{
            {"displayName", name}, {"uniqueID", name}, {"providers", PropertyList::Array{"org.example.a"}}});
    }
    return MissingFontsChoice(PropertyList::Dictionary{{"fonts", std::move(rows)}});
}

TEST(DialogPicture, HasOneRowForEachFontAndMarksWhatIsNotAvailable)
{
    auto choice = choiceOf(2);
    choice.nextProvider();
    const auto lines = dialogPicture(choice, {80, 24}, false);
    ASSERT_EQ(lines.size(), 7U);
    EXPECT_THAT(lines[1], HasSubstr("2 missing fonts"));
    EXPECT_THAT(lines[3], HasSubstr("not available"));
    EXPECT_THAT(lines[3], HasSubstr("Un\\x1B[31mknown"));
    EXPECT_THAT(lines[4], HasSubstr("> Family 1"));
    EXPECT_THAT(lines[4], HasSubstr("< org.example.a"));
}

TEST(DialogPicture, FitsIntoTerminalsOfEverySizeWithTheSelectedRowInSight)
{
    for (const std::size_t columns : {20U, 40U, 80U, 200U}) {
        for (const std::size_t height : {7U, 10U, 24U, 100U}) {
            auto choice = choiceOf(50);
            for (int count = 0; count < 30; ++count) {
                choice.selectNext();
            }
            bool isSelectedInSight = false;
            const auto lines = dialogPicture(choice, {columns, height}, false);
            EXPECT_LE(lines.size(), height);
            for (const auto& line : lines) {
                EXPECT_LE(displayWidth(line), columns) << line;
                isSelectedInSight = isSelectedInSight || line.front() == '>';
            }
            EXPECT_TRUE(isSelectedInSight) << columns << "x" << height;
        }
    }
}

TEST(DialogPicture, FontsThatNobodyHasCanAllBeBroughtIntoSight)
{
    auto choice = choiceOf(1);
    EXPECT_THAT(dialogPicture(choice, {80, 24}, false).back(), "Enter: done");
    EXPECT_EQ(dialogPicture(choice, {80, 24}, false)[3].front(), ' ');
    PropertyList::Array rows;
    for (int number = 0; number < 50; ++number) {
        rows.push_back(PropertyList::Dictionary{{"displayName", "Unknown " + std::to_string(number)}});
    }
    MissingFontsChoice unknown(PropertyList::Dictionary{{"fonts", std::move(rows)}});
    EXPECT_THAT(dialogPicture(unknown, {80, 24}, false).back(), "Up/Down: font  Enter: done");
    for (int number = 0; number < 50; ++number) {
        EXPECT_THAT(dialogPicture(unknown, {80, 24}, false),
                    ::testing::Contains(HasSubstr("> Unknown " + std::to_string(number))));
        unknown.selectNext();
    }
}

TEST(TerminalKeys, AreReadFromSequencesLettersAndPieces)
{
    TerminalKeys keys;
    EXPECT_THAT(keys.read("\x1B[A\x1B[B\x1B[C\x1B[D\r"),
                ElementsAre(Key::up, Key::down, Key::right, Key::left, Key::enter));
    EXPECT_THAT(keys.read("\x1BOAkjhl q\x03"), ElementsAre(Key::up, Key::up, Key::down, Key::left, Key::right,
                                                           Key::right, Key::escape, Key::interrupt));
    EXPECT_THAT(keys.read("\x1B"), IsEmpty());
    EXPECT_THAT(keys.read("["), IsEmpty());
    EXPECT_THAT(keys.read("B"), ElementsAre(Key::down));
}

TEST(TerminalKeys, ALoneEscapeIsAKeyWhenNothingFollows)
{
    TerminalKeys keys;
    EXPECT_THAT(keys.read("\x1B"), IsEmpty());
    EXPECT_TRUE(keys.isWaiting());
    EXPECT_THAT(keys.flush(), ElementsAre(Key::escape));
    EXPECT_FALSE(keys.isWaiting());
    EXPECT_THAT(keys.flush(), IsEmpty());
}

TEST(TerminalKeys, WhatMeansNothingIsDropped)
{
    TerminalKeys keys;
    EXPECT_THAT(keys.read("\x1B[1;5A\x1B[15~\x1Bxzy\x80\xFF"), IsEmpty());
    EXPECT_THAT(keys.read("\r"), ElementsAre(Key::enter));
}

TEST(LoginTerminals, AreNamedByTheirDevices)
{
    EXPECT_EQ(terminalPath((136U << 8) | 7U), "/dev/pts/7");
    EXPECT_EQ(terminalPath((136U << 8) | 0x2CU | (0x1U << 20)), "/dev/pts/300");
    EXPECT_EQ(terminalPath((4U << 8) | 2U), "/dev/tty2");
    EXPECT_EQ(terminalPath((4U << 8) | 64U), "/dev/ttyS0");
    EXPECT_EQ(terminalPath((1U << 8) | 3U), "");
    EXPECT_EQ(terminalPath(0), "");
}

}  // namespace
}  // namespace typhon
