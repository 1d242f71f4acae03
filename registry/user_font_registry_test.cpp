#include "platform/simulated/simulated_platform.h"
#include "registry/user_font_registry.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;

const std::string registryPath = "/var/mobile/Library/UserFonts/UserFonts.plist";

Dictionary registryOf(const std::string& path)
{
    return {{path, Dictionary{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}}}};
}

class UserFontRegistryTest : public testing::Test {
protected:
    std::size_t errors() const
    {
        return simulated.log.count(LogSink::daemon, LogLevel::error, "error reading " + registryPath);
    }
    bool holds(const std::string& path)
    {
        const auto info = registry.userFontsInfo();
        return info && info->entry(path) != nullptr;
    }

    SimulatedPlatform simulated;
    UserFontUpdates updates{simulated.platform.processWideQueues};
    UserFontRegistry registry{simulated.fileSystem, simulated.log, updates};
};

TEST_F(UserFontRegistryTest, AMissingFileIsAnEmptyRegistryAndIsNotLookedForAgainUntilInvalidation)
{
    EXPECT_FALSE(registry.isUserFontInstalled());
    EXPECT_EQ(registry.userFontsInfo(), nullptr);
    EXPECT_TRUE(simulated.log.entries().empty());

    simulated.fileSystem.addFile(registryPath, registryOf("/f/X/a.ttf"));
    EXPECT_FALSE(registry.isUserFontInstalled());
    EXPECT_EQ(simulated.fileSystem.reads(), 0U);

    registry.invalidateUserFonts();
    EXPECT_TRUE(registry.isUserFontInstalled());
}

TEST_F(UserFontRegistryTest, AnEmptyRootDictionaryIsLikeAMissingFile)
{
    simulated.fileSystem.addFile(registryPath, Dictionary{});
    EXPECT_FALSE(registry.isUserFontInstalled());
    EXPECT_EQ(registry.userFontsInfo(), nullptr);
    EXPECT_EQ(simulated.fileSystem.reads(registryPath), 1U);
    EXPECT_TRUE(simulated.log.entries().empty());
}

TEST_F(UserFontRegistryTest, ATruncatedFileIsLoggedOncePerLoadAndReadsAsEmpty)
{
    simulated.fileSystem.addMalformedFile(registryPath);
    EXPECT_FALSE(registry.isUserFontInstalled());
    EXPECT_EQ(registry.userFontsInfo(), nullptr);
    EXPECT_EQ(errors(), 1U);
    EXPECT_EQ(simulated.fileSystem.reads(registryPath), 1U);

    registry.invalidateUserFonts();
    EXPECT_FALSE(registry.isUserFontInstalled());
    EXPECT_EQ(errors(), 2U);
}

TEST_F(UserFontRegistryTest, ARootThatIsNotADictionaryIsAMalformedFile)
{
    simulated.fileSystem.addFile(registryPath, PropertyList::Array{"a"});
    EXPECT_FALSE(registry.isUserFontInstalled());
    EXPECT_EQ(registry._userFontsInfoFromDisk(), std::nullopt);
    EXPECT_EQ(errors(), 2U);
}

TEST_F(UserFontRegistryTest, TheFileIsReadOnceAndAfreshAfterInvalidation)
{
    simulated.fileSystem.addFile(registryPath, registryOf("/f/X/a.ttf"));
    EXPECT_TRUE(holds("/f/X/a.ttf"));
    simulated.fileSystem.addFile(registryPath, registryOf("/f/X/b.ttf"));
    EXPECT_TRUE(holds("/f/X/a.ttf"));
    EXPECT_EQ(simulated.fileSystem.reads(registryPath), 1U);

    registry.invalidateUserFonts();
    EXPECT_TRUE(holds("/f/X/b.ttf"));
    EXPECT_FALSE(holds("/f/X/a.ttf"));
}

TEST_F(UserFontRegistryTest, AllCallersShareOneSnapshot)
{
    simulated.fileSystem.addFile(registryPath, registryOf("/f/X/a.ttf"));
    EXPECT_EQ(registry.userFontsInfo(), registry.userFontsInfo());
}

TEST_F(UserFontRegistryTest, ALoadThatAnInvalidationOvertakesIsNotKept)
{
    simulated.fileSystem.addFile(registryPath, registryOf("/f/X/old.ttf"));
    simulated.fileSystem.setDuringRead([&](const std::string&) {
        simulated.fileSystem.setDuringRead(nullptr);
        simulated.fileSystem.addFile(registryPath, registryOf("/f/X/new.ttf"));
        registry.invalidateUserFonts();
    });
    EXPECT_TRUE(holds("/f/X/old.ttf"));
    EXPECT_TRUE(holds("/f/X/new.ttf"));
    EXPECT_EQ(simulated.fileSystem.reads(registryPath), 2U);
}

TEST_F(UserFontRegistryTest, ContentsSetDuringALoadAreNotOverwrittenByIt)
{
    simulated.fileSystem.addFile(registryPath, registryOf("/f/X/old.ttf"));
    simulated.fileSystem.setDuringRead(
        [&](const std::string&) { registry.setUserFontsInfo(registryOf("/f/X/set.ttf")); });
    EXPECT_TRUE(registry.isUserFontInstalled());
    EXPECT_TRUE(holds("/f/X/set.ttf"));
    EXPECT_FALSE(holds("/f/X/old.ttf"));
}

TEST_F(UserFontRegistryTest, SettingNullForgetsTheContents)
{
    registry.setUserFontsInfo(registryOf("/f/X/set.ttf"));
    EXPECT_TRUE(holds("/f/X/set.ttf"));
    EXPECT_EQ(simulated.fileSystem.reads(), 0U);
    registry.setUserFontsInfo(std::nullopt);
    EXPECT_FALSE(registry.isUserFontInstalled());
}

TEST_F(UserFontRegistryTest, MalformedEntriesAreLoggedOncePerKindAndTheRestServes)
{
    auto root = registryOf("/f/X/a.ttf");
    root.emplace("/f/X/b.ttf", "text");
    root.emplace("/f/X/c.ttf", 1);
    root.emplace("/f/X/d.ttf", Dictionary{{"disabled", "true"}});
    simulated.fileSystem.addFile(registryPath, root);

    EXPECT_TRUE(holds("/f/X/a.ttf"));
    EXPECT_FALSE(holds("/f/X/b.ttf"));
    EXPECT_FALSE(holds("/f/X/d.ttf"));
    EXPECT_EQ(simulated.log.text(LogLevel::error),
              registryPath + ": entries left out that are not dictionaries: 2, the first: /f/X/b.ttf\n" +
                  registryPath +
                  ": entries left out that have a \"disabled\" that is not a boolean: 1, "
                  "the first: /f/X/d.ttf\n");

    registry.userFontsInfo();
    EXPECT_EQ(simulated.log.entries().size(), 2U);
    registry.invalidateUserFonts();
    registry.userFontsInfo();
    EXPECT_EQ(simulated.log.entries().size(), 4U);
}

TEST_F(UserFontRegistryTest, AHundredThousandEntriesServe)
{
    Dictionary root;
    for (int number = 0; number < 100'000; ++number) {
        root.emplace("/f/X/" + std::to_string(number) + ".ttf", Dictionary{});
    }
    root.emplace("/f/X/broken.ttf", 1);
    simulated.fileSystem.addFile(registryPath, std::move(root));
    EXPECT_EQ(registry.userFontsInfo()->count(), 100'000U);
    EXPECT_EQ(registry.userFontsInfo()->enumerationView().asDictionary()->size(), 100'000U);
    EXPECT_EQ(simulated.log.entries().size(), 1U);
}

TEST_F(UserFontRegistryTest, AnEntryNestedSixtyFourLevelsDeepIsCarriedThrough)
{
    PropertyList nested = "deep";
    for (int level = 0; level < 64; ++level) {
        nested = Dictionary{{"deeper", nested}};
    }
    const PropertyList entry = Dictionary{{"other", nested}};
    simulated.fileSystem.addFile(registryPath, Dictionary{{"/f/X/a.ttf", entry}});
    EXPECT_EQ(*registry.userFontsInfo()->enumerationView().find("/f/X/a.ttf"), entry);
}

TEST_F(UserFontRegistryTest, ARegistryOfMalformedEntriesOnlyIsEmpty)
{
    simulated.fileSystem.addFile(registryPath, Dictionary{{"/f/X/a.ttf", 1}});
    EXPECT_FALSE(registry.isUserFontInstalled());
    EXPECT_EQ(registry.userFontsInfo(), nullptr);
    EXPECT_EQ(simulated.fileSystem.reads(registryPath), 1U);
}

TEST_F(UserFontRegistryTest, TheFileAsItIsComesFromDiskWithMalformedEntriesAndIsNotKept)
{
    simulated.fileSystem.addFile(registryPath, Dictionary{{"/f/X/a.ttf", 1}});
    EXPECT_EQ(registry._userFontsInfoFromDisk(), PropertyList(Dictionary{{"/f/X/a.ttf", 1}}));
    EXPECT_EQ(registry._userFontsInfoFromDisk(), PropertyList(Dictionary{{"/f/X/a.ttf", 1}}));
    EXPECT_EQ(simulated.fileSystem.reads(registryPath), 2U);
}

}  // namespace
}  // namespace typhon
