#include "platform/linux/catalogue_source.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using ::testing::HasSubstr;

class CatalogueSourceTest : public testing::Test {
protected:
    CatalogueSourceReading read(const std::string& contents)
    {
        scratch.writeFile("/etc/typhon/catalogue-sources.d/a.b.plist",
                          "<plist version=\"1.0\"><dict>" + contents + "</dict></plist>");
        return catalogueSourceOf(root, "a.b");
    }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
};

TEST_F(CatalogueSourceTest, AUrlAloneIsASource)
{
    const auto [source, isConfigured] = read("<key>URL</key><string>https://example.org/</string>");
    ASSERT_TRUE(source.value) << source.error;
    EXPECT_TRUE(isConfigured);
    EXPECT_EQ(source.value->url, "https://example.org/");
    EXPECT_EQ(source.value->certificates, "");
    EXPECT_EQ(source.value->stallSeconds, 30U);
    EXPECT_EQ(source.value->totalSeconds, 900U);
}

TEST_F(CatalogueSourceTest, TimesAreKeptWithinBounds)
{
    const std::string url = "<key>URL</key><string>https://example.org/</string>";
    auto source = read(url + "<key>StallSeconds</key><integer>0</integer>"
                             "<key>TotalSeconds</key><integer>-5</integer>")
                      .source;
    EXPECT_EQ(source.value->stallSeconds, 1U);
    EXPECT_EQ(source.value->totalSeconds, 1U);
    source = read(url + "<key>StallSeconds</key><integer>99999999999</integer>"
                        "<key>TotalSeconds</key><integer>99999999999</integer>")
                 .source;
    EXPECT_EQ(source.value->stallSeconds, 3600U);
    EXPECT_EQ(source.value->totalSeconds, 86'400U);
    source = read(url + "<key>StallSeconds</key><string>7</string>").source;
    EXPECT_EQ(source.value->stallSeconds, 30U);
}

TEST_F(CatalogueSourceTest, NobodyHasToConfigureOne)
{
    const auto [source, isConfigured] = catalogueSourceOf(root, "a.b");
    EXPECT_FALSE(source.value);
    EXPECT_FALSE(isConfigured);
    EXPECT_THAT(source.error, HasSubstr("/etc/typhon/catalogue-sources.d/a.b.plist"));
}

TEST_F(CatalogueSourceTest, WhatIsNoSourceIsSaid)
{
    for (const std::string contents :
         {"", "<key>URL</key><string></string>", "<key>URL</key><integer>1</integer>",
          "<key>URL</key><string>https://example.org/&#10;</string>", "<broken"}) {
        const auto [source, isConfigured] = read(contents);
        EXPECT_FALSE(source.value) << contents;
        EXPECT_TRUE(isConfigured) << contents;
    }
    EXPECT_FALSE(read("<key>URL</key><string>" + std::string(2049, 'a') + "</string>").source.value);
    std::filesystem::create_directory(scratch.real("/etc/typhon/catalogue-sources.d/folder.plist"));
    EXPECT_TRUE(catalogueSourceOf(root, "folder").isConfigured);
}

TEST_F(CatalogueSourceTest, ATypeCannotNameAnotherFile)
{
    scratch.writeFile("/etc/typhon/x.plist", "<plist version=\"1.0\"><dict><key>URL</key>"
                                             "<string>https://example.org/</string></dict></plist>");
    EXPECT_FALSE(catalogueSourceOf(root, "../x").source.value);
    EXPECT_FALSE(catalogueSourceOf(root, "").source.value);
}

}  // namespace
}  // namespace typhon
