#include "platform/linux/visible_text.h"

#include <string>

#include <gtest/gtest.h>

namespace typhon {
namespace {

TEST(VisibleText, LeavesHarmlessTextAlone)
{
    EXPECT_EQ(visibleText(""), "");
    EXPECT_EQ(visibleText("resolved.  This call \\ \xC3\xA9 \xE2\x82\xAC \xF0\x9F\x98\x80"),
              "resolved.  This call \\ \xC3\xA9 \xE2\x82\xAC \xF0\x9F\x98\x80");
}

TEST(VisibleText, EscapesWhatWouldStartALineOrDriveATerminal)
{
    EXPECT_EQ(visibleText("a\nb\r\tc"), "a\\nb\\r\\tc");
    EXPECT_EQ(visibleText(std::string_view("\0\x1B[31m\x7F", 7)), "\\x00\\x1B[31m\\x7F");
    EXPECT_EQ(visibleText("\xC2\x9B"), "\\u009B");
}

TEST(VisibleText, ReplacesWhatIsNoUtf8)
{
    const std::string replacement = "\xEF\xBF\xBD";
    EXPECT_EQ(visibleText("a\xFFz"), "a" + replacement + "z");
    EXPECT_EQ(visibleText("\xC3"), replacement);
    EXPECT_EQ(visibleText("\xC3("), replacement + "(");
    // A longer form than needed, a surrogate, and a value beyond the last character.
    EXPECT_EQ(visibleText("\xC0\x80"), replacement + replacement);
    EXPECT_EQ(visibleText("\xED\xA0\x80"), replacement + replacement + replacement);
    EXPECT_EQ(visibleText("\xF4\x90\x80\x80"), replacement + replacement + replacement + replacement);
}

TEST(VisibleText, CutsBetweenCharactersAndSaysHowMuchIsMissing)
{
    EXPECT_EQ(visibleText("abcdef", 6), "abcdef");
    EXPECT_EQ(visibleText("abcdef", 5), "abcde... [1 bytes more]");
    EXPECT_EQ(visibleText("ab\xE2\x82\xAC"
                          "c",
                          4),
              "ab... [4 bytes more]");
    EXPECT_EQ(visibleText("a\n", 2), "a... [1 bytes more]");
}

}  // namespace
}  // namespace typhon
