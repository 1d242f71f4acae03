#include "platform/linux/desktop_entry.h"

#include <string>

#include <gtest/gtest.h>

namespace typhon {
namespace {

std::optional<DesktopEntry> parse(const std::string& keys)
{
    return parseDesktopEntry("[Desktop Entry]\nType=Application\n" + keys);
}

TEST(DesktopEntry, AnApplicationIsOne)
{
    ASSERT_TRUE(parse("Name=Letters\nExec=letters %U\n"));
    EXPECT_FALSE(parse("")->isPlaceholder);
    EXPECT_TRUE(parseDesktopEntry("# comment\n\n  [Desktop Entry] \r\n Type = Application\r\n"));
}

TEST(DesktopEntry, WhatIsNoApplicationIsNone)
{
    EXPECT_FALSE(parseDesktopEntry(""));
    EXPECT_FALSE(parseDesktopEntry("[Desktop Entry]\nName=No type\n"));
    EXPECT_FALSE(parseDesktopEntry("[Desktop Entry]\nType=Link\n"));
    EXPECT_FALSE(parseDesktopEntry("[Desktop Action new]\nType=Application\n"));
    EXPECT_FALSE(parseDesktopEntry("Type=Application\n[Desktop Entry]\n"));
    EXPECT_FALSE(parseDesktopEntry(std::string_view("\0\xFF\n=\n[", 6)));
}

TEST(DesktopEntry, HiddenMeansDeleted)
{
    EXPECT_FALSE(parse("Hidden=true\n"));
    EXPECT_TRUE(parse("Hidden=false\n"));
    EXPECT_TRUE(parse("NoDisplay=true\n"));
}

TEST(DesktopEntry, PlaceholdersSaySo)
{
    EXPECT_TRUE(parse("X-Typhon-Placeholder=true\n")->isPlaceholder);
    EXPECT_FALSE(parse("X-Typhon-Placeholder=1\n")->isPlaceholder);
    EXPECT_FALSE(parse("X-Typhon-Placeholder=false\nX-Typhon-Placeholder=true\n")->isPlaceholder);
}

TEST(DesktopEntry, KeysOfOtherGroupsDoNotCount)
{
    EXPECT_TRUE(parse("[Desktop Action new]\nHidden=true\n"));
    EXPECT_FALSE(parse("[Desktop Action new]\nX-Typhon-Placeholder=true\n")->isPlaceholder);
}

}  // namespace
}  // namespace typhon
