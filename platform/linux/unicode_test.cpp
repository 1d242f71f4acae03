#include "platform/linux/unicode.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Bytes = std::vector<std::uint8_t>;

Bytes utf16(std::string_view text)
{
    Bytes bytes;
    appendUtf16BigEndian(bytes, text);
    return bytes;
}

TEST(UnicodeTest, AcceptsTheFirstAndLastCharacterOfEveryLength)
{
    for (const std::string_view text :
         {"\x7F", "\xC2\x80", "\xDF\xBF", "\xE0\xA0\x80", "\xED\x9F\xBF", "\xEE\x80\x80", "\xEF\xBF\xBF",
          "\xF0\x90\x80\x80", "\xF4\x8F\xBF\xBF", "plain", ""})
        EXPECT_TRUE(isUtf8(text)) << text;
    EXPECT_TRUE(isUtf8(std::string_view("\0", 1)));
}

TEST(UnicodeTest, RefusesInvalidUtf8)
{
    for (const std::string_view text :
         {"\x80", "\xBF", "\xC0\x80", "\xC1\xBF", "\xC2", "\xC2\x41", "\xE0\x9F\xBF", "\xE2\x82",
          "\xED\xA0\x80", "\xED\xBF\xBF", "\xF0\x8F\xBF\xBF", "\xF4\x90\x80\x80", "\xF5\x80\x80\x80",
          "\xF0\x9F\x98", "\xFE", "\xFF", "long enough for a word \xFF", "1234567\x80"})
        EXPECT_FALSE(isUtf8(text)) << text;
}

TEST(UnicodeTest, TellsAsciiAtEveryLength)
{
    for (std::size_t length = 0; length < 40; ++length) {
        std::string text(length, 'a');
        EXPECT_TRUE(isAscii(text));
        for (std::size_t at = 0; at < length; ++at) {
            text[at] = '\x80';
            EXPECT_FALSE(isAscii(text)) << length << " " << at;
            text[at] = '\x7F';
        }
    }
}

TEST(UnicodeTest, ConvertsEveryCharacterToUtf16AndBack)
{
    std::string text;
    for (char32_t character = 0; character <= 0x10FFFF; ++character) {
        if (character < 0xD800 || character > 0xDFFF)
            appendUtf8(text, character);
    }
    EXPECT_TRUE(isUtf8(text));
    EXPECT_EQ(utf8FromUtf16BigEndian(utf16(text)), text);
}

TEST(UnicodeTest, WritesSurrogatePairsHighFirst)
{
    EXPECT_EQ(utf16("\xF0\x9F\x98\x80"), (Bytes{0xD8, 0x3D, 0xDE, 0x00}));
    EXPECT_EQ(utf16("\xE2\x82\xAC"), (Bytes{0x20, 0xAC}));
}

TEST(UnicodeTest, ReplacesInvalidBytesOneByOne)
{
    EXPECT_EQ(utf16("\xE2\x82"), (Bytes{0xFF, 0xFD, 0xFF, 0xFD}));
}

TEST(UnicodeTest, RefusesUnpairedSurrogates)
{
    EXPECT_FALSE(utf8FromUtf16BigEndian(Bytes{0xD8, 0x3D}));
    EXPECT_FALSE(utf8FromUtf16BigEndian(Bytes{0xDE, 0x00}));
    EXPECT_FALSE(utf8FromUtf16BigEndian(Bytes{0xDE, 0x00, 0xD8, 0x3D}));
    EXPECT_FALSE(utf8FromUtf16BigEndian(Bytes{0xD8, 0x3D, 0x00, 0x41}));
    EXPECT_FALSE(utf8FromUtf16BigEndian(Bytes{0xD8, 0x3D, 0xD8, 0x3D}));
    EXPECT_FALSE(utf8FromUtf16BigEndian(Bytes{0x00}));
    EXPECT_EQ(utf8FromUtf16BigEndian(Bytes{}), "");
}

}  // namespace
}  // namespace typhon
