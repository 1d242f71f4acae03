#include "fontmanager/font_store_fixture.h"
#include "fontmanager/profile_fonts.h"

#include <gmock/gmock.h>

namespace typhon {
namespace {

using namespace test_store;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class ProfileFontsTest : public testing::Test {
protected:
    ProfileFontsTest() { std::filesystem::create_directories(root.real(font_paths::userFonts)); }

    PropertyList record() const { return readFontRecord(root, font_paths::profileFonts); }

    const std::string managed = font_paths::managedFonts;
    ScratchDirectory scratch;
    KeptLog log;
    RootDirectory root{scratch.path()};
    ProfileFonts fonts{root, readText, log};
};

TEST_F(ProfileFontsTest, WithoutTheirDirectoryThereAreNone)
{
    const auto outcome = fonts.synchronize();
    EXPECT_EQ(outcome.error, std::nullopt);
    EXPECT_FALSE(outcome.change.isRegistryChanged);
    EXPECT_EQ(record(), PropertyList());
}

TEST_F(ProfileFontsTest, FontsThatCameAreRecordedAndThoseThatWentForgotten)
{
    scratch.writeFile(managed + "a.ttf", "font A");
    scratch.writeFile(managed + "profile/b.otf", "font B");
    EXPECT_THAT(fonts.synchronize().change.available,
                ElementsAre(managed + "a.ttf", managed + "profile/b.otf"));
    EXPECT_EQ(
        *record().find(managed + "profile/b.otf"),
        PropertyList(PropertyList::Dictionary{{"familyName", PropertyList::Dictionary{{"B", "Family"}}}}));
    std::filesystem::remove(root.real(managed + "a.ttf"));
    const auto later = fonts.synchronize();
    EXPECT_THAT(later.change.gone, ElementsAre(managed + "a.ttf"));
    EXPECT_THAT(later.change.available, IsEmpty());
    EXPECT_EQ(record().asDictionary()->size(), 1u);
}

TEST_F(ProfileFontsTest, NothingIsWrittenOrToldWhenNothingChanged)
{
    scratch.writeFile(managed + "a.ttf", "font A");
    fonts.synchronize();
    EXPECT_FALSE(fonts.synchronize().change.isRegistryChanged);
}

TEST_F(ProfileFontsTest, AFontWithOtherNamesIsAvailableAnew)
{
    scratch.writeFile(managed + "a.ttf", "font A");
    fonts.synchronize();
    scratch.writeFile(managed + "a.ttf", "font Other");
    EXPECT_THAT(fonts.synchronize().change.available, ElementsAre(managed + "a.ttf"));
}

TEST_F(ProfileFontsTest, OneBadFontKeepsOutNoOther)
{
    scratch.writeFile(managed + "a.ttf", "garbage");
    scratch.writeFile(managed + "b.ttf", "font B");
    scratch.writeFile(managed + "notes.txt", "font C");
    EXPECT_THAT(fonts.synchronize().change.available, ElementsAre(managed + "b.ttf"));
    EXPECT_TRUE(log.has("a.ttf is left out: not a font"));
}

TEST_F(ProfileFontsTest, SymbolicLinksAreLeftOut)
{
    scratch.writeFile("/elsewhere/b.ttf", "font B");
    scratch.writeFile(managed + "a.ttf", "font A");
    std::filesystem::create_symlink(scratch.real("/elsewhere/b.ttf"), root.real(managed + "b.ttf"));
    std::filesystem::create_directory_symlink(scratch.real("/elsewhere"), root.real(managed + "folder"));
    EXPECT_THAT(fonts.synchronize().change.available, ElementsAre(managed + "a.ttf"));
}

TEST_F(ProfileFontsTest, ABrokenRecordIsMadeAnew)
{
    scratch.writeFile(managed + "a.ttf", "font A");
    scratch.writeFile(font_paths::profileFonts, "broken");
    EXPECT_THAT(fonts.synchronize().change.available, ElementsAre(managed + "a.ttf"));
    EXPECT_EQ(record().asDictionary()->size(), 1u);
}

}  // namespace
}  // namespace typhon
