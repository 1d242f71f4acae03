#include "fontmanager/font_names.h"
#include "fontmanager/test_fonts.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>
#include <map>
#include <string>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::HasSubstr;
using Names = std::map<std::string, std::string>;

FontNamesReading namesIn(const std::string& path, const FontLimits& limits = {})
{
    return readFontNames(openRegularFile(path).file.get(), limits);
}

class FontNamesTest : public testing::Test {
protected:
    FontNamesReading namesOf(const std::string& contents, const FontLimits& limits = {}) const
    {
        scratch.writeFile("/font", contents);
        return namesIn(scratch.real("/font"), limits);
    }
    ScratchDirectory scratch;
};

TEST_F(FontNamesTest, AFontHasOneFace)
{
    EXPECT_EQ(namesIn(test_fonts::sansBold).familyNames, (Names{{"DejaVuSans-Bold", "DejaVu Sans"}}));
    EXPECT_EQ(namesIn(test_fonts::serif).familyNames, (Names{{"LiberationSerif", "Liberation Serif"}}));
    EXPECT_EQ(namesIn(test_fonts::sans).error, "");
}

TEST_F(FontNamesTest, ACollectionHasAPairForEachFace)
{
    EXPECT_EQ(namesIn(test_fonts::collection).familyNames,
              (Names{{"WenQuanYiMicroHei", "WenQuanYi Micro Hei"},
                     {"WenQuanYiMicroHeiMono", "WenQuanYi Micro Hei Mono"}}));
    const auto made = test_fonts::collectionOf(
        {test_fonts::contentsOf(test_fonts::sans), test_fonts::contentsOf(test_fonts::serif)});
    EXPECT_EQ(namesOf(made).familyNames,
              (Names{{"DejaVuSans", "DejaVu Sans"}, {"LiberationSerif", "Liberation Serif"}}));
}

TEST_F(FontNamesTest, TheFamilyIsTheTypographicOne)
{
    // By its plain name each weight of this family would be a family of its own.
    EXPECT_EQ(namesIn("/usr/share/fonts/truetype/lato/Lato-Black.ttf").familyNames,
              (Names{{"Lato-Black", "Lato"}}));
}

TEST_F(FontNamesTest, WhatIsNoFontIsAnError)
{
    EXPECT_EQ(namesOf("").error, "not a TrueType or OpenType font");
    EXPECT_EQ(namesOf("%!PS-AdobeFont-1.0: Letters").error, "not a TrueType or OpenType font");
    EXPECT_EQ(namesOf("ttc").error, "not a TrueType or OpenType font");
    EXPECT_EQ(namesOf("not a font at all").familyNames, std::nullopt);
    EXPECT_EQ(readFontNames(-1).error, "not a regular file");
}

TEST_F(FontNamesTest, ATruncatedFontIsAnError)
{
    const auto whole = test_fonts::contentsOf(test_fonts::serif);
    for (const std::size_t size : {4u, 12u, 100u, 300u, 1000u}) {
        const auto reading = namesOf(whole.substr(0, size));
        EXPECT_EQ(reading.familyNames, std::nullopt) << size;
        EXPECT_THAT(reading.error, HasSubstr("cannot be read")) << size;
    }
}

TEST_F(FontNamesTest, ACollectionWithABrokenFaceIsAnError)
{
    auto made = test_fonts::collectionOf(
        {test_fonts::contentsOf(test_fonts::sans), test_fonts::contentsOf(test_fonts::serif)});
    made.resize(test_fonts::read32(made, 16) + 4);
    EXPECT_THAT(namesOf(made).error, HasSubstr("face 1"));
}

TEST_F(FontNamesTest, BytesChangedAnywhereNeverDoHarm)
{
    const auto whole = test_fonts::contentsOf(test_fonts::serif);
    for (std::size_t round = 0; round < 300; ++round) {
        auto changed = whole;
        changed[4 + round * 7 % 3000] = static_cast<char>(round * 37 + 1);
        const auto reading = namesOf(changed);
        EXPECT_NE(reading.familyNames.has_value(), !reading.error.empty());
    }
}

TEST_F(FontNamesTest, LimitsAreKept)
{
    EXPECT_EQ(namesIn(test_fonts::sans, {.bytes = 1000}).error, "larger than 1000 bytes");
    EXPECT_THAT(namesIn(test_fonts::collection, {.faces = 1}).error, HasSubstr("the font has 2 faces"));
    EXPECT_THAT(namesIn(test_fonts::sans, {.nameBytes = 3}).error, HasSubstr("no usable PostScript name"));
    EXPECT_THAT(namesIn(test_fonts::sans, {.nameBytes = 10}).error, HasSubstr("no usable family name"));
    scratch.writeFile("/huge", "ttcf");
    std::filesystem::resize_file(scratch.real("/huge"), std::uintmax_t(1) << 40);
    EXPECT_THAT(namesIn(scratch.real("/huge")).error, HasSubstr("larger than"));
}

TEST_F(FontNamesTest, TheOffsetOfTheDescriptorDoesNotMatterAndStays)
{
    const auto opened = openRegularFile(test_fonts::sans);
    ASSERT_EQ(::lseek(opened.file.get(), 1234, SEEK_SET), 1234);
    EXPECT_TRUE(readFontNames(opened.file.get()).familyNames);
    EXPECT_EQ(::lseek(opened.file.get(), 0, SEEK_CUR), 1234);
}

}  // namespace
}  // namespace typhon
