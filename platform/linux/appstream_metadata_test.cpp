#include "platform/linux/appstream_metadata.h"

#include <string>

#include <gtest/gtest.h>

namespace typhon {
namespace {

std::optional<AppStreamMetadata> parse(const std::string& document)
{
    return parseAppStreamMetadata(document);
}

std::optional<std::string> versionOf(const std::string& releases)
{
    const auto metadata = parse("<component><id>a.b</id><releases>" + releases + "</releases></component>");
    return metadata ? metadata->version : "malformed";
}

TEST(AppStreamMetadata, GivesIdentifierAndVersion)
{
    const auto metadata = parse("<?xml version=\"1.0\"?>\n<component type=\"desktop-application\">\n"
                                "  <id>\n com.example.Letters.desktop </id><name>Letters</name>\n"
                                "  <releases><release version=\"2.1\" date=\"2024-01-05\">"
                                "<description><p>x</p></description></release></releases>\n</component>");
    ASSERT_TRUE(metadata);
    EXPECT_EQ(metadata->identifier, "com.example.Letters.desktop");
    EXPECT_EQ(metadata->version, "2.1");
}

TEST(AppStreamMetadata, TheNewestReleaseCounts)
{
    EXPECT_EQ(versionOf(""), std::nullopt);
    EXPECT_EQ(versionOf("<release version='2'/><release version='3'/>"), "2");
    EXPECT_EQ(versionOf("<release version='1' date='2023-05-01'/><release version='2' date='2024-01-01'/>"),
              "2");
    EXPECT_EQ(
        versionOf("<release version='2' timestamp='1704067200'/><release version='1' date='2023-05-01'/>"),
        "2");
    EXPECT_EQ(versionOf("<release version='1' timestamp='1'/><release version='2' timestamp='1704067200'/>"),
              "2");
    EXPECT_EQ(versionOf("<release date='2024-01-01'/><release version='1' date='2023-05-01'/>"), "1");
    EXPECT_EQ(versionOf("<release version='1' timestamp='99999999999999999999'/>"), "1");
}

TEST(AppStreamMetadata, OnlyTheComponentsOwnElementsCount)
{
    const auto metadata = parse("<component><provides><id>other</id></provides><id>a.b</id>"
                                "<custom><releases><release version='9'/></releases></custom></component>");
    ASSERT_TRUE(metadata);
    EXPECT_EQ(metadata->identifier, "a.b");
    EXPECT_EQ(metadata->version, std::nullopt);
}

TEST(AppStreamMetadata, MalformedDocumentsAreNone)
{
    EXPECT_FALSE(parse(""));
    EXPECT_FALSE(parse("<component><id>a.b</id>"));
    EXPECT_FALSE(parse("<components><id>a.b</id></components>"));
    EXPECT_FALSE(parse("<component><id> </id></component>"));
    EXPECT_FALSE(parse("<component><id>" + std::string(1000, 'x') + "</id></component>"));
    EXPECT_FALSE(parse("<component><id>a.b</id>\xFF</component>"));
    std::string deep;
    for (int level = 0; level < 100; ++level) {
        deep += "<x>";
    }
    EXPECT_FALSE(parse("<component><id>a.b</id>" + deep));
}

TEST(AppStreamMetadata, EntitiesAreRefusedAndNothingIsLoaded)
{
    EXPECT_FALSE(parse("<!DOCTYPE component [<!ENTITY x 'a.b'>]><component><id>&x;</id></component>"));
    EXPECT_FALSE(parse("<!DOCTYPE component [<!ENTITY x SYSTEM 'file:///etc/hostname'>]>"
                       "<component><id>&x;</id></component>"));
    EXPECT_FALSE(parse("<!DOCTYPE component [<!ENTITY % x SYSTEM '/dev/zero'> %x;]>"
                       "<component><id>a.b</id></component>"));
    EXPECT_TRUE(parse("<!DOCTYPE component SYSTEM '/dev/zero'><component><id>a.b</id></component>"));
}

}  // namespace
}  // namespace typhon
