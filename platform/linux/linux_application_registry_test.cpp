#include "platform/linux/linux_application_registry.h"
#include "platform/linux/scratch_directory.h"
#include "testing/no_new_descriptors.h"

#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace typhon {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

class RecordingLog final : public Log {
public:
    void write(LogSink, LogLevel, std::string_view message) override { messages.emplace_back(message); }
    std::vector<std::string> messages;
};

constexpr const char* entryText = "[Desktop Entry]\nType=Application\nName=Letters\n";

std::string metadataText(const std::string& identifier, const std::string& version)
{
    return "<component><id>" + identifier + "</id><releases><release version=\"" + version +
           "\"/></releases></component>";
}

class LinuxApplicationRegistryTest : public testing::Test {
protected:
    bool isInstalled(const std::string& identifier) { return registry.record(identifier, false).has_value(); }
    std::optional<std::string> version(const std::string& identifier)
    {
        const auto record = registry.record(identifier, false);
        return record ? record->shortVersionString : "not installed";
    }

    ScratchDirectory scratch;
    RecordingLog log;
    LinuxApplicationRegistry registry{RootDirectory(scratch.path()), log};
};

TEST_F(LinuxApplicationRegistryTest, FindsApplicationsInEveryDataDirectory)
{
    int number = 0;
    for (const std::string data :
         {"/usr/share", "/usr/local/share", "/var/lib/flatpak/exports/share", "/home/ada/.local/share",
          "/home/bob/.local/share", "/home/bob/.local/share/flatpak/exports/share"}) {
        const auto identifier = "com.example.app" + std::to_string(number++);
        EXPECT_FALSE(isInstalled(identifier)) << data;
        scratch.writeFile(data + "/applications/" + identifier + ".desktop", entryText);
        EXPECT_TRUE(isInstalled(identifier)) << data;
    }
    EXPECT_THAT(log.messages, ElementsAre());
}

TEST_F(LinuxApplicationRegistryTest, SubdirectoriesBecomePartOfTheIdentifier)
{
    scratch.writeFile("/usr/share/applications/kde/sub/letters.desktop", entryText);
    EXPECT_TRUE(isInstalled("kde-sub-letters"));
    EXPECT_FALSE(isInstalled("letters"));
    EXPECT_FALSE(isInstalled("kde/sub/letters"));
}

TEST_F(LinuxApplicationRegistryTest, ChangesAreSeenAtOnce)
{
    scratch.writeFile("/usr/share/applications/a.b.desktop", entryText);
    EXPECT_EQ(version("a.b"), std::nullopt);
    scratch.writeFile("/usr/share/metainfo/a.b.metainfo.xml", metadataText("a.b", "1.0"));
    EXPECT_EQ(version("a.b"), "1.0");
    for (int release = 2; release < 20; ++release) {
        scratch.writeFile("/usr/share/metainfo/a.b.metainfo.xml",
                          metadataText("a.b", std::to_string(release)));
        ASSERT_EQ(version("a.b"), std::to_string(release));
    }
    scratch.writeFile("/usr/share/applications/a.b.desktop", std::string(entryText) + "Hidden=true\n");
    EXPECT_FALSE(isInstalled("a.b"));
    std::filesystem::remove(scratch.real("/usr/share/applications/a.b.desktop"));
    EXPECT_FALSE(isInstalled("a.b"));
}

TEST_F(LinuxApplicationRegistryTest, EntriesAddedInQuickSuccessionAreAllSeen)
{
    for (int n = 0; n < 200; ++n) {
        const auto identifier = "app" + std::to_string(n);
        scratch.writeFile("/usr/share/applications/" + identifier + ".desktop", entryText);
        ASSERT_TRUE(isInstalled(identifier));
    }
}

TEST_F(LinuxApplicationRegistryTest, MetadataIsFoundByItsComponentIdentifier)
{
    scratch.writeFile("/usr/share/applications/a.b.desktop", entryText);
    scratch.writeFile("/usr/share/applications/c.d.desktop", entryText);
    scratch.writeFile("/usr/share/metainfo/other-name.appdata.xml", metadataText("a.b.desktop", "2.1"));
    scratch.writeFile("/usr/share/metainfo/c.d.xml", metadataText("c.d", "3"));
    EXPECT_EQ(version("a.b"), "2.1");
    EXPECT_EQ(version("c.d"), std::nullopt);
}

TEST_F(LinuxApplicationRegistryTest, PlaceholdersAreGivenOnlyToWhoAccepts)
{
    scratch.writeFile("/usr/share/applications/a.b.desktop",
                      std::string(entryText) + "X-Typhon-Placeholder=true\n");
    EXPECT_EQ(registry.record("a.b", false), std::nullopt);
    const auto record = registry.record("a.b", true);
    ASSERT_TRUE(record);
    EXPECT_TRUE(record->isPlaceholder);
    scratch.writeFile("/home/ada/.local/share/applications/a.b.desktop", entryText);
    EXPECT_TRUE(isInstalled("a.b"));
}

TEST_F(LinuxApplicationRegistryTest, WhatTheAdministratorInstalledComesFirst)
{
    scratch.writeFile("/home/ada/.local/share/applications/a.b.desktop", entryText);
    scratch.writeFile("/home/ada/.local/share/metainfo/a.b.metainfo.xml", metadataText("a.b", "99"));
    EXPECT_EQ(version("a.b"), "99");
    scratch.writeFile("/usr/share/applications/a.b.desktop", entryText);
    scratch.writeFile("/usr/share/metainfo/a.b.metainfo.xml", metadataText("a.b", "1"));
    EXPECT_EQ(version("a.b"), "1");
}

TEST_F(LinuxApplicationRegistryTest, AUsersFlatpaksAreLinksIntoThatUsersInstallation)
{
    const std::string flatpak = "/home/ada/.local/share/flatpak";
    const std::string entry = "applications/org.example.letters.desktop";
    const std::string exported = "app/org.example.letters/current/active/export/share/";
    scratch.writeFile(flatpak + "/" + exported + entry, entryText);
    std::filesystem::create_directories(scratch.real(flatpak + "/exports/share/applications"));
    std::filesystem::create_symlink("../../../" + exported + entry,
                                    scratch.real(flatpak + "/exports/share/" + entry));
    EXPECT_EQ(version("org.example.letters"), std::nullopt);
    std::filesystem::remove_all(scratch.real(flatpak + "/app"));
    EXPECT_FALSE(isInstalled("org.example.letters"));
}

TEST_F(LinuxApplicationRegistryTest, WhatAUserInstalledComesBeforeThatUsersFlatpaks)
{
    const std::string own = "/home/ada/.local/share/";
    const std::string flatpaks = own + "flatpak/exports/share/";
    for (const auto& [data, release] : {std::pair(flatpaks, "1"), std::pair(own, "2")}) {
        scratch.writeFile(data + "applications/a.b.desktop", entryText);
        scratch.writeFile(data + "metainfo/a.b.metainfo.xml", metadataText("a.b", release));
        EXPECT_EQ(version("a.b"), release);
    }
}

TEST_F(LinuxApplicationRegistryTest, LinksToFilesAreFollowedAndPipesAreNotOpened)
{
    scratch.writeFile("/opt/letters.desktop", entryText);
    std::filesystem::create_directories(scratch.real("/usr/share/applications"));
    std::filesystem::create_symlink(scratch.real("/opt/letters.desktop"),
                                    scratch.real("/usr/share/applications/a.b.desktop"));
    ASSERT_EQ(::mkfifo(scratch.real("/usr/share/applications/pipe.desktop").c_str(), 0644), 0);
    std::filesystem::create_directories(scratch.real("/usr/share/metainfo"));
    ASSERT_EQ(::mkfifo(scratch.real("/usr/share/metainfo/pipe.metainfo.xml").c_str(), 0644), 0);
    EXPECT_TRUE(isInstalled("a.b"));
    EXPECT_FALSE(isInstalled("pipe"));
}

TEST_F(LinuxApplicationRegistryTest, AUsersDataLeadsNowhereElse)
{
    // /proc stands for a file system that the user could be serving.
    std::filesystem::create_directories(scratch.real("/home/eve/.local/share"));
    std::filesystem::create_symlink("/proc/self/fd", scratch.real("/home/eve/.local/share/applications"));
    scratch.writeFile("/home/bob/.local/share/applications/a.b.desktop", entryText);
    std::filesystem::create_symlink("/proc/self/status",
                                    scratch.real("/home/bob/.local/share/applications/e.f.desktop"));
    EXPECT_TRUE(isInstalled("a.b"));
    EXPECT_FALSE(isInstalled("e.f"));
    EXPECT_THAT(log.messages, ElementsAre());
}

TEST_F(LinuxApplicationRegistryTest, TooDeepDirectoriesAreLoggedOnceAndIgnored)
{
    scratch.writeFile("/usr/share/applications/1/2/3/4/5/deep.desktop", entryText);
    scratch.writeFile("/usr/share/applications/1/2/3/fine.desktop", entryText);
    EXPECT_TRUE(isInstalled("1-2-3-fine"));
    EXPECT_FALSE(isInstalled("1-2-3-4-5-deep"));
    ASSERT_EQ(log.messages.size(), 1u);
    EXPECT_THAT(log.messages[0], HasSubstr("too deep"));
}

TEST_F(LinuxApplicationRegistryTest, OversizedAndMalformedFilesDoNotHideTheOthers)
{
    scratch.writeFile("/usr/share/applications/a.b.desktop", entryText);
    scratch.writeFile("/usr/share/applications/huge.desktop", entryText);
    std::filesystem::resize_file(scratch.real("/usr/share/applications/huge.desktop"), 2u << 20);
    scratch.writeFile("/usr/share/applications/broken.desktop", "\xFF\xFE nothing");
    scratch.writeFile("/usr/share/applications/.desktop", entryText);
    scratch.writeFile("/usr/share/metainfo/0.metainfo.xml", "<component>");
    scratch.writeFile("/usr/share/metainfo/1.metainfo.xml", metadataText("a.b", "1"));
    EXPECT_EQ(version("a.b"), "1");
    EXPECT_FALSE(isInstalled("huge"));
    EXPECT_FALSE(isInstalled("broken"));
    EXPECT_FALSE(isInstalled(""));
}

TEST_F(LinuxApplicationRegistryTest, AUserWithTooMuchMetadataIsCutShortAndLogged)
{
    scratch.writeFile("/home/eve/.local/share/applications/a.b.desktop", entryText);
    for (int n = 0; n < 9; ++n) {
        const auto file = "/home/eve/.local/share/metainfo/" + std::to_string(n) + ".metainfo.xml";
        scratch.writeFile(file, n == 0 ? metadataText("a.b", "1") : "not XML");
        if (n != 0) {
            std::filesystem::resize_file(scratch.real(file), 5u << 20);
        }
    }
    EXPECT_EQ(version("a.b"), "1");
    ASSERT_EQ(log.messages.size(), 1u);
    EXPECT_THAT(log.messages[0], HasSubstr("metainfo is too large"));
}

TEST_F(LinuxApplicationRegistryTest, AFirstLookThatFailsIsRepeated)
{
    scratch.writeFile("/usr/share/applications/a.b.desktop", entryText);
    scratch.writeFile("/home/ada/.local/share/applications/c.d.desktop", entryText);
    {
        const NoNewDescriptors shortage;
        EXPECT_FALSE(isInstalled("a.b"));
        EXPECT_FALSE(isInstalled("c.d"));
        EXPECT_FALSE(registry.isKnownToBeAbsent("a.b"));
    }
    EXPECT_TRUE(isInstalled("a.b"));
    EXPECT_TRUE(isInstalled("c.d"));
    EXPECT_FALSE(log.messages.empty());
}

TEST_F(LinuxApplicationRegistryTest, WhileAHomeIsAwayNothingIsKnownToBeAbsent)
{
    scratch.writeFile("/home/ada/.local/share/applications/a.b.desktop", entryText);
    EXPECT_TRUE(registry.isKnownToBeAbsent("c.d"));
    std::filesystem::rename(scratch.real("/home/ada"), scratch.real("/ada"));
    std::filesystem::create_directory(scratch.real("/home/ada"));
    EXPECT_FALSE(isInstalled("a.b"));
    EXPECT_FALSE(registry.isKnownToBeAbsent("a.b"));
    EXPECT_FALSE(registry.isKnownToBeAbsent("c.d")) << "it could be there too";
    std::filesystem::remove(scratch.real("/home/ada"));
    std::filesystem::rename(scratch.real("/ada"), scratch.real("/home/ada"));
    EXPECT_TRUE(isInstalled("a.b"));
    EXPECT_TRUE(registry.isKnownToBeAbsent("c.d"));
}

TEST_F(LinuxApplicationRegistryTest, AHomeWithoutApplicationsIsNotAway)
{
    scratch.writeFile("/home/ada/.profile", "");
    EXPECT_TRUE(registry.isKnownToBeAbsent("a.b"));
}

TEST_F(LinuxApplicationRegistryTest, WhatWasTooMuchToLookAtIsNotKnownToBeAbsent)
{
    scratch.writeFile("/usr/share/applications/1/2/3/4/5/deep.desktop", entryText);
    EXPECT_FALSE(registry.isKnownToBeAbsent("1-2-3-4-5-deep"));
}

TEST(LinuxApplicationRegistryOnThisMachine, AnswersWithoutAScratchRoot)
{
    RecordingLog log;
    LinuxApplicationRegistry registry(RootDirectory(), log);
    EXPECT_EQ(registry.record("com.vorlan.no-such-application", true), std::nullopt);
}

}  // namespace
}  // namespace typhon
