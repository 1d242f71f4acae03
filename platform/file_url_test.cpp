#include "platform/file_url.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

TEST(FileUrlTest, APathKeepsItsPlainCharactersAndHasTheOthersEncoded)
{
    EXPECT_EQ(fileUrlFromPath("/var/Fonts/Alpha-Bold_1.ttf"), "file:///var/Fonts/Alpha-Bold_1.ttf");
    EXPECT_EQ(fileUrlFromPath("/a b%c?d#e"), "file:///a%20b%25c%3Fd%23e");
    EXPECT_EQ(fileUrlFromPath("/\xC3\xA4\x7F"), "file:///%C3%A4%7F");
}

TEST(FileUrlTest, AUrlGivesThePathItWasMadeFrom)
{
    std::string path = "/";
    for (int byte = 1; byte < 256; ++byte) {
        path += static_cast<char>(byte);
    }
    EXPECT_EQ(pathFromFileUrl(fileUrlFromPath(path)), path);
}

TEST(FileUrlTest, SchemeAndHostAreReadInEitherCaseAndTheHostMayBeMissing)
{
    for (const auto* url :
         {"file:///a", "FILE:///a", "file://localhost/a", "file://LocalHost/a", "file:/a"}) {
        EXPECT_EQ(pathFromFileUrl(url), "/a") << url;
    }
}

TEST(FileUrlTest, EscapesAreReadInEitherCase)
{
    EXPECT_EQ(pathFromFileUrl("file:///%c3%A4%20"), "/\xC3\xA4 ");
}

TEST(FileUrlTest, DotsAreKeptAsTheyAre)
{
    EXPECT_EQ(pathFromFileUrl("file:///a/../%2e%2e/b"), "/a/../../b");
}

TEST(FileUrlTest, OtherSchemesAndHostsAndRelativePathsNameNoFile)
{
    for (const auto* url : {"", "file", "file:", "file://", "file://localhost", "file:a", "/a", "a",
                            "http:///a", "files:///a", "file://host/a", "file://localhostess/a",
                            "file://localhost:80/a", "file://user@localhost/a", " file:///a"}) {
        EXPECT_EQ(pathFromFileUrl(url), std::nullopt) << url;
    }
}

TEST(FileUrlTest, CharactersThatMustBeEncodedAndQueriesAndFragmentsAreRefused)
{
    for (const auto* url : {"file:///a b", "file:///a?b", "file:///a#b", "file:///\xC3\xA4", "file:///a\n",
                            "file:///a\\b", "file:///[a]", "file:///\"", "file:///a\x7F"}) {
        EXPECT_EQ(pathFromFileUrl(url), std::nullopt) << url;
    }
    EXPECT_EQ(pathFromFileUrl(std::string_view("file:///a\0b", 11)), std::nullopt);
}

TEST(FileUrlTest, BrokenEscapesAndThoseOfZeroBytesAndSlashesAreRefused)
{
    for (const auto* url : {"file:///%", "file:///%4", "file:///%G0", "file:///%0G", "file:///%%41",
                            "file:///a%00b", "file:///a%2Fb", "file:///%-1", "file:///% 1"}) {
        EXPECT_EQ(pathFromFileUrl(url), std::nullopt) << url;
    }
}

TEST(FileUrlTest, APathMayBeSoLongAndNoLonger)
{
    const std::string longest(longestFileUrlPath, '/');
    EXPECT_EQ(pathFromFileUrl("file://" + longest), longest);
    EXPECT_EQ(pathFromFileUrl("file://" + longest + "a"), std::nullopt);
    EXPECT_EQ(pathFromFileUrl("file://" + std::string(1'000'000, '/')), std::nullopt);
    EXPECT_EQ(pathFromFileUrl(fileUrlFromPath("/" + std::string(longestFileUrlPath - 1, ' '))),
              "/" + std::string(longestFileUrlPath - 1, ' '));
}

}  // namespace
}  // namespace typhon
