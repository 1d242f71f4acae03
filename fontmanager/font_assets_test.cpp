#include "fontmanager/font_asset_files.h"
#include "fontmanager/font_assets.h"
#include "fontmanager/font_names.h"
#include "fontmanager/font_paths.h"
#include "fontmanager/profile_fonts.h"
#include "fontmanager/test_fonts.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>
#include <functional>
#include <utility>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

const std::string store = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";
const std::string own = "/var/mobile/Library/UserFonts/FontAssets/";

class FontAssetsTest : public testing::Test {
protected:
    void install(const std::string& asset, const std::string& name, const char* font = test_fonts::sans)
    {
        scratch.writeFile(store + asset + "/AssetData/" + name, test_fonts::contentsOf(font));
    }
    RegistryChange synchronize()
    {
        auto outcome = assets.synchronize();
        EXPECT_EQ(outcome.error, std::nullopt);
        return outcome.change;
    }
    std::vector<std::string> registered() const
    {
        std::vector<std::string> paths;
        const auto record = readFontRecord(root, font_paths::registry);
        for (const auto& [path, entry] : *record.asDictionary()) {
            paths.push_back(path);
        }
        return paths;
    }
    bool isThere(const std::string& path) const { return fs::exists(scratch.real(path)); }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    unsigned readings = 0;
    /// Happens during the next reading of a font.
    std::function<void()> meanwhile = [] {};
    FontAssets assets{root,
                      [this](int file) {
                          ++readings;
                          std::exchange(meanwhile, [] {})();
                          return readFontNames(file);
                      },
                      log};
    FontAssetsTest() { fs::create_directories(scratch.real(font_paths::userFonts)); }
};

TEST_F(FontAssetsTest, FontsOfAssetsAreLinkedAndRegistered)
{
    install("a.asset", "a.ttf");
    install("b.asset", "b.ttf", test_fonts::serif);
    EXPECT_THAT(synchronize().available, ElementsAre(own + "a.asset/a.ttf", own + "b.asset/b.ttf"));
    EXPECT_THAT(registered(), ElementsAre(own + "a.asset/a.ttf", own + "b.asset/b.ttf"));
    EXPECT_EQ(fs::hard_link_count(scratch.real(own + "a.asset/a.ttf")), 2U);
}

TEST_F(FontAssetsTest, WhatIsInStepIsNotReadAgain)
{
    install("a.asset", "a.ttf");
    synchronize();
    readings = 0;
    EXPECT_FALSE(synchronize().isRegistryChanged);
    EXPECT_EQ(readings, 0U);
    install("b.asset", "b.ttf");
    synchronize();
    EXPECT_EQ(readings, 1U);
}

TEST_F(FontAssetsTest, WhatComesMeanwhileIsTakenInToo)
{
    install("b.asset", "b.ttf");
    meanwhile = [&] { install("a.asset", "a.ttf"); };
    EXPECT_THAT(synchronize().available, ElementsAre(own + "b.asset/b.ttf", own + "a.asset/a.ttf"));
    EXPECT_THAT(registered(), ElementsAre(own + "a.asset/a.ttf", own + "b.asset/b.ttf"));
}

TEST_F(FontAssetsTest, WhatGoesMeanwhileIsReportedAsGoneOnly)
{
    install("a.asset", "a.ttf");
    install("b.asset", "b.ttf");
    meanwhile = [&] { fs::remove_all(scratch.real(store + "a.asset")); };
    const auto change = synchronize();
    EXPECT_THAT(change.available, ElementsAre(own + "b.asset/b.ttf"));
    EXPECT_THAT(change.gone, ElementsAre(own + "a.asset/a.ttf"));
    EXPECT_THAT(registered(), ElementsAre(own + "b.asset/b.ttf"));
}

TEST_F(FontAssetsTest, ABadFontKeepsOutNothingElse)
{
    scratch.writeFile(store + "a.asset/AssetData/bad.ttf", "garbage");
    scratch.writeFile(store + "a.asset/AssetData/readme.txt", "text");
    install("a.asset", "good.ttf");
    install("b.asset", "b.ttf", test_fonts::serif);
    synchronize();
    EXPECT_THAT(registered(), ElementsAre(own + "a.asset/good.ttf", own + "b.asset/b.ttf"));
    EXPECT_FALSE(isThere(own + "a.asset/bad.ttf"));
}

TEST_F(FontAssetsTest, AssetsThatAreGoneAreUnregisteredAndTheirFilesRemoved)
{
    install("a.asset", "a.ttf");
    install("b.asset", "b.ttf", test_fonts::serif);
    synchronize();
    fs::remove_all(scratch.real(store + "a.asset"));
    EXPECT_THAT(synchronize().gone, ElementsAre(own + "a.asset/a.ttf"));
    EXPECT_FALSE(isThere(own + "a.asset"));
    fs::remove_all(scratch.real("/private"));
    synchronize();
    EXPECT_THAT(registered(), IsEmpty());
    EXPECT_FALSE(isThere(own + "b.asset"));
}

TEST_F(FontAssetsTest, AReplacedFileIsRegisteredWithItsNewNamesAndStaysSwitchedOff)
{
    install("a.asset", "a.ttf");
    synchronize();
    const auto path = own + "a.asset/a.ttf";
    EXPECT_EQ(RegistryWriter(root).setDisabled({path}, true), std::nullopt);
    fs::remove(scratch.real(store + "a.asset/AssetData/a.ttf"));
    install("a.asset", "a.ttf", test_fonts::serif);
    const auto change = synchronize();
    EXPECT_THAT(change.available, IsEmpty());
    EXPECT_TRUE(change.isRegistryChanged);
    const auto record = readFontRecord(root, font_paths::registry);
    EXPECT_TRUE(record.find(path)->find("disabled")->isTrue());
    EXPECT_NE(record.find(path)->find("familyName")->find("LiberationSerif"), nullptr);
}

TEST_F(FontAssetsTest, OtherFontsOfTheRegistryAreLeftAlone)
{
    const std::string other = std::string(font_paths::fontFiles) + "org.example.a/x.ttf";
    EXPECT_EQ(RegistryWriter(root).add({{other, {{"X", "X"}}, false}}), std::nullopt);
    install("a.asset", "a.ttf");
    synchronize();
    fs::remove_all(scratch.real(store + "a.asset"));
    synchronize();
    EXPECT_THAT(registered(), ElementsAre(other));
}

TEST_F(FontAssetsTest, AnAssetThatTheDiskFailsForKeepsItsFontsAndKeepsOutNoOther)
{
    std::vector<std::string> expected;
    for (const char* name : {"a.ttf", "b.ttf", "c.ttf", "x.ttf", "y.ttf", "z.ttf"}) {
        install("a.asset", name);
        expected.push_back(own + "a.asset/" + name);
    }
    synchronize();
    install("a.asset", "new.ttf");
    install("b.asset", "b.ttf", test_fonts::serif);
    // Nothing can take its place.
    scratch.writeFile(own + "a.asset/new.ttf/in-the-way", "");
    const auto outcome = assets.synchronize();
    EXPECT_THAT(outcome.error.value_or(""), testing::HasSubstr("a.asset"));
    EXPECT_THAT(outcome.change.gone, IsEmpty());
    expected.push_back(own + "b.asset/b.ttf");
    EXPECT_EQ(registered(), expected);
    for (const auto& path : expected) {
        EXPECT_TRUE(isThere(path)) << path;
    }
    fs::remove_all(scratch.real(own + "a.asset/new.ttf"));
    EXPECT_THAT(synchronize().available, ElementsAre(own + "a.asset/new.ttf"));
}

TEST_F(FontAssetsTest, AFontThatCannotBeLinkedIsCopiedAndKnownAgain)
{
    const auto contents = test_fonts::contentsOf(test_fonts::sans);
    // On a file system of its own.
    const FileDescriptor from(::memfd_create("font", MFD_CLOEXEC));
    ASSERT_EQ(::write(from.get(), contents.data(), contents.size()), static_cast<ssize_t>(contents.size()));
    struct stat status {};
    ASSERT_EQ(::fstat(from.get(), &status), 0);
    const FileDescriptor directory(::open(scratch.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    ASSERT_EQ(placeAssetFile(from.get(), status, directory.get(), "a.ttf"), std::nullopt);
    EXPECT_EQ(scratch.readFile("/a.ttf"), contents);
    EXPECT_TRUE(isPlacedAssetFile(status, directory.get(), "a.ttf"));
    scratch.writeFile("/a.ttf", contents + "changed");
    EXPECT_FALSE(isPlacedAssetFile(status, directory.get(), "a.ttf"));
}

TEST_F(FontAssetsTest, LinksThatLeadOutOfTheStoreAreNotFollowed)
{
    scratch.writeFile("/elsewhere/AssetData/a.ttf", test_fonts::contentsOf(test_fonts::sans));
    fs::create_directories(scratch.real(store + "b.asset/AssetData"));
    fs::create_symlink(scratch.real("/elsewhere"), scratch.real(store + "a.asset"));
    fs::create_symlink(scratch.real("/elsewhere/AssetData/a.ttf"),
                       scratch.real(store + "b.asset/AssetData/b.ttf"));
    synchronize();
    EXPECT_THAT(registered(), IsEmpty());
}

}  // namespace
}  // namespace typhon
