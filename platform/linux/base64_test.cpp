#include "platform/linux/base64.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Bytes = std::vector<std::uint8_t>;

TEST(Base64Test, WritesTheKnownTexts)
{
    const std::pair<std::string_view, std::string> known[] = {
        {"", ""},
        {"f", "Zg=="},
        {"fo", "Zm8="},
        {"foo", "Zm9v"},
        {"foob", "Zm9vYg=="},
        {"fooba", "Zm9vYmE="},
        {"foobar", "Zm9vYmFy"},
    };
    for (const auto& [text, encoded] : known) {
        const Bytes bytes(text.begin(), text.end());
        EXPECT_EQ(base64FromBytes(bytes), encoded);
        EXPECT_EQ(bytesFromBase64(encoded), bytes);
    }
}

TEST(Base64Test, ReadsBackAllBytesAtEveryAlignment)
{
    Bytes bytes;
    for (unsigned index = 0; index < 600; ++index) {
        bytes.push_back(static_cast<std::uint8_t>(index * 7));
        EXPECT_EQ(bytesFromBase64(base64FromBytes(bytes)), bytes);
    }
}

TEST(Base64Test, SkipsWhiteSpaceAnywhere)
{
    EXPECT_EQ(bytesFromBase64(" \tZ\ng\r=\n= \n"), Bytes{'f'});
    EXPECT_EQ(bytesFromBase64(" \n"), Bytes{});
}

TEST(Base64Test, RefusesWhatIsNoCompleteText)
{
    for (const auto* text : {"Z", "Zg", "Zg=", "Zm8", "Zm9v=", "=", "====", "Z===", "Zg===", "Zg==Zg==",
                             "Zg=g", "Zm8=Z", "Zm9v!", "Zm9v-", "Zm9v_", "Zm\xC3\xA4"})
        EXPECT_FALSE(bytesFromBase64(text)) << text;
    EXPECT_FALSE(bytesFromBase64(std::string_view("Zm9v\0", 5)));
}

TEST(Base64Test, RefusesBitsThatBelongToNoByte)
{
    EXPECT_FALSE(bytesFromBase64("Zh=="));
    EXPECT_FALSE(bytesFromBase64("Zm9="));
}

TEST(Base64Test, DecodesInPiecesCutAnywhere)
{
    const std::string_view text = "Zm9v YmE=";
    for (std::size_t cut = 0; cut <= text.size(); ++cut) {
        Base64Decoder decoder;
        Bytes bytes;
        EXPECT_TRUE(decoder.decode(text.substr(0, cut), bytes));
        EXPECT_TRUE(decoder.decode(text.substr(cut), bytes));
        EXPECT_TRUE(decoder.finish());
        EXPECT_EQ(bytes, (Bytes{'f', 'o', 'o', 'b', 'a'}));
    }
}

TEST(Base64Test, StartsAnewOnceFinished)
{
    Base64Decoder decoder;
    Bytes bytes;
    EXPECT_TRUE(decoder.decode("Zg=", bytes));
    EXPECT_FALSE(decoder.finish());
    EXPECT_TRUE(decoder.decode("Zg==", bytes));
    EXPECT_TRUE(decoder.finish());
}

}  // namespace
}  // namespace typhon
