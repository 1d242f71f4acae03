#include "fontmanager/font_paths.h"

#include <string>

#include <gtest/gtest.h>

namespace typhon::font_paths {
namespace {

TEST(FontPathsTest, AFontFileLiesDirectlyInAProvidersDirectory)
{
    const auto place = placeOfFontFile("/var/mobile/Library/UserFonts/FontFiles/org.example.a/b c.ttf");
    ASSERT_TRUE(place);
    EXPECT_EQ(place->directory, "org.example.a");
    EXPECT_EQ(place->name, "b c.ttf");
}

TEST(FontPathsTest, EverythingElseIsNoFontFilesPath)
{
    const std::string files = fontFiles;
    for (const auto& path :
         {files, files + "a", files + "a/", files + "/b.ttf", files + "a/b/c.ttf", files + "../b.ttf",
          files + "./b.ttf", files + "a/..", files + "a/.", files + "a/" + std::string(1, '\0'),
          std::string("/var/mobile/Library/UserFonts/FontAssets/a/b.ttf"), std::string()}) {
        EXPECT_FALSE(placeOfFontFile(path)) << path;
    }
}

TEST(FontPathsTest, OrdinaryFontFileNamesAreTaken)
{
    for (const auto* name : {"a.ttf", "A b (1).OTF", "\xC3\xA9.ttc", "x.y.oTc", "-.ttf"}) {
        EXPECT_EQ(objectionToFontFileName(name), std::nullopt) << name;
    }
    EXPECT_EQ(objectionToFontFileName(std::string(251, 'a') + ".ttf"), std::nullopt);
}

TEST(FontPathsTest, NamesThatLeadElsewhereOrHideAreRefused)
{
    for (const auto& name :
         {std::string(), std::string("."), std::string(".."), std::string("../a.ttf"), std::string("a/b.ttf"),
          std::string("/a.ttf"), std::string(".a.ttf"), std::string(".ttf"), std::string("a\n.ttf"),
          std::string("a\x1B[2J.ttf"), std::string("a\0.ttf", 6), std::string("\xFF.ttf"), std::string("a"),
          std::string("a.txt"), std::string("ttf"), std::string("a.ttf "), std::string(252, 'a') + ".ttf"}) {
        EXPECT_NE(objectionToFontFileName(name), std::nullopt) << name;
    }
}

}  // namespace
}  // namespace typhon::font_paths
