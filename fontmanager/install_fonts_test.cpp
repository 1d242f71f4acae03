#include "fontmanager/install_fonts.h"
#include "fontmanager/test_fonts.h"
#include "platform/linux/linux_file_system.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace typhon {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

const std::string registry = "/var/mobile/Library/UserFonts/UserFonts.plist";
const std::string shop = "/var/mobile/Library/UserFonts/FontFiles/com.example.shop";

class InstallFontsTest : public testing::Test {
protected:
    FontInstallation install(const std::vector<std::string>& files, bool enabled = true)
    {
        return installFontFiles(root, "com.example.shop", files, enabled);
    }
    std::optional<PropertyList> stored() { return LinuxFileSystem(root).readPropertyList(registry).value; }
    std::optional<std::vector<std::string>> installedFiles()
    {
        return LinuxFileSystem(root).contentsOfDirectory(shop);
    }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
};

TEST_F(InstallFontsTest, CopiesAndRegistersEachFile)
{
    const auto done = install({test_fonts::sansBold, test_fonts::collection});
    EXPECT_EQ(done.error, std::nullopt);
    EXPECT_THAT(done.paths, ElementsAre(shop + "/DejaVuSans-Bold.ttf", shop + "/wqy-microhei.ttc"));
    EXPECT_EQ(installedFiles(), (std::vector<std::string>{"DejaVuSans-Bold.ttf", "wqy-microhei.ttc"}));
    EXPECT_EQ(scratch.readFile(shop + "/DejaVuSans-Bold.ttf"), test_fonts::contentsOf(test_fonts::sansBold));
    const PropertyList expected(PropertyList::Dictionary{
        {shop + "/DejaVuSans-Bold.ttf",
         PropertyList::Dictionary{
             {"familyName", PropertyList::Dictionary{{"DejaVuSans-Bold", "DejaVu Sans"}}},
             {"disabled", false}}},
        {shop + "/wqy-microhei.ttc",
         PropertyList::Dictionary{
             {"familyName", PropertyList::Dictionary{{"WenQuanYiMicroHei", "WenQuanYi Micro Hei"},
                                                     {"WenQuanYiMicroHeiMono", "WenQuanYi Micro Hei Mono"}}},
             {"disabled", false}}}});
    EXPECT_EQ(stored(), expected);
}

TEST_F(InstallFontsTest, FilesAreForEverybodyToReadWhateverTheirSourcesWere)
{
    scratch.writeFile("/source.ttf", test_fonts::contentsOf(test_fonts::sans));
    std::filesystem::permissions(scratch.real("/source.ttf"), std::filesystem::perms(0600));
    ASSERT_EQ(install({scratch.real("/source.ttf")}, false).error, std::nullopt);
    struct stat status {};
    ASSERT_EQ(::stat(scratch.real(shop + "/source.ttf").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0644u);
    EXPECT_TRUE(stored()->find(shop + "/source.ttf")->find("disabled")->isTrue());
}

TEST_F(InstallFontsTest, AnIdentifierThatNeedsEscapingHasItsOwnDirectory)
{
    const auto done = installFontFiles(root, "shop/../x", {test_fonts::sans}, true);
    EXPECT_EQ(done.error, std::nullopt);
    EXPECT_THAT(done.paths,
                ElementsAre("/var/mobile/Library/UserFonts/FontFiles/shop%2F..%2Fx/DejaVuSans.ttf"));
    EXPECT_THAT(installFontFiles(root, "", {test_fonts::sans}, true).error.value_or(""),
                HasSubstr("identifier"));
}

TEST_F(InstallFontsTest, AFileOfTheSameNameIsReplaced)
{
    scratch.writeFile("/one/font.ttf", test_fonts::contentsOf(test_fonts::sans));
    scratch.writeFile("/two/font.ttf", test_fonts::contentsOf(test_fonts::serif));
    ASSERT_EQ(install({scratch.real("/one/font.ttf")}).error, std::nullopt);
    ASSERT_EQ(install({scratch.real("/two/font.ttf")}).error, std::nullopt);
    EXPECT_EQ(stored()->asDictionary()->size(), 1u);
    EXPECT_EQ(*stored()->find(shop + "/font.ttf")->find("familyName"),
              PropertyList(PropertyList::Dictionary{{"LiberationSerif", "Liberation Serif"}}));
    EXPECT_EQ(scratch.readFile(shop + "/font.ttf"), test_fonts::contentsOf(test_fonts::serif));
}

TEST_F(InstallFontsTest, OneBadFileAndNothingIsInstalled)
{
    scratch.writeFile("/bad.ttf", "not a font");
    const auto done = install({test_fonts::sans, scratch.real("/bad.ttf")});
    EXPECT_EQ(done.error, scratch.real("/bad.ttf") + ": not a TrueType or OpenType font");
    EXPECT_TRUE(done.paths.empty());
    EXPECT_EQ(installedFiles(), std::vector<std::string>());
    EXPECT_EQ(stored(), std::nullopt);
}

TEST_F(InstallFontsTest, SourcesThatAreNoFilesOrHaveUnusableNamesAreRefused)
{
    ASSERT_EQ(::mkfifo(scratch.real("/pipe.ttf").c_str(), 0600), 0);
    EXPECT_THAT(install({scratch.real("/pipe.ttf")}).error.value_or(""), HasSubstr("not a regular file"));
    EXPECT_THAT(install({scratch.real("/absent.ttf")}).error.value_or(""), HasSubstr("No such file"));
    EXPECT_THAT(install({test_fonts::sans, test_fonts::sans}).error.value_or(""),
                HasSubstr("two of the font files"));
    for (const char* name : {"/.hidden.ttf", "/line\nbreak.ttf", "/\xFF.ttf", "/"}) {
        EXPECT_THAT(install({scratch.real(name)}).error.value_or(""), HasSubstr("plain name")) << name;
    }
    EXPECT_EQ(installedFiles(), std::vector<std::string>());
}

TEST_F(InstallFontsTest, WhatACrashLeftIsSweptAway)
{
    scratch.writeFile(shop + "/.installing-7", "half a font");
    ASSERT_EQ(install({test_fonts::sans}).error, std::nullopt);
    EXPECT_EQ(installedFiles(), std::vector<std::string>{"DejaVuSans.ttf"});
}

TEST_F(InstallFontsTest, AMalformedRegistryStopsTheInstallationBeforeAnyCopy)
{
    scratch.writeFile(registry, "bplist00");
    EXPECT_THAT(install({test_fonts::sans}).error.value_or(""), HasSubstr("is malformed"));
    EXPECT_EQ(installedFiles(), std::nullopt);
}

}  // namespace
}  // namespace typhon
