#include "platform/linux/linux_file_system.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_file_system.h"

#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {
namespace {

/// One tree of files, and how the suite makes it.
class Subject {
public:
    virtual ~Subject() = default;
    virtual FileSystem& files() = 0;
    virtual void addFile(const std::string& path, PropertyList value) = 0;
    virtual void addMalformedFile(const std::string& path) = 0;
    virtual void addDirectory(const std::string& path) = 0;
    virtual void remove(const std::string& path) = 0;
};

class SimulatedSubject final : public Subject {
public:
    FileSystem& files() override { return files_; }
    void addFile(const std::string& path, PropertyList value) override
    {
        files_.addFile(path, std::move(value));
    }
    void addMalformedFile(const std::string& path) override { files_.addMalformedFile(path); }
    void addDirectory(const std::string& path) override { files_.addDirectory(path); }
    void remove(const std::string& path) override { files_.remove(path); }

private:
    SimulatedFileSystem files_;
};

class LinuxSubject final : public Subject {
public:
    FileSystem& files() override { return files_; }
    void addFile(const std::string& path, PropertyList value) override
    {
        const auto bytes = writeBinaryPropertyList(value);
        scratch_.writeFile(path, std::string(bytes.begin(), bytes.end()));
    }
    void addMalformedFile(const std::string& path) override { scratch_.writeFile(path, "bplist00"); }
    void addDirectory(const std::string& path) override
    {
        std::filesystem::create_directories(scratch_.real(path));
    }
    void remove(const std::string& path) override { std::filesystem::remove_all(scratch_.real(path)); }

private:
    ScratchDirectory scratch_;
    LinuxFileSystem files_{RootDirectory(scratch_.path())};
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class FileSystemContract : public testing::TestWithParam<Implementation> {
protected:
    FileSystem& files() { return subject->files(); }
    const std::unique_ptr<Subject> subject = GetParam().make();
};

TEST_P(FileSystemContract, FilesAndDirectoriesExist)
{
    subject->addFile("/var/mobile/file", PropertyList());
    EXPECT_TRUE(files().exists("/var/mobile/file"));
    EXPECT_TRUE(files().exists("/var/mobile"));
    EXPECT_TRUE(files().exists("/var/mobile/"));
    EXPECT_FALSE(files().exists("/var/mobile/fil"));
    EXPECT_FALSE(files().exists("/var/mobile/file2"));
    subject->remove("/var");
    EXPECT_FALSE(files().exists("/var/mobile/file"));
}

TEST_P(FileSystemContract, APropertyListIsReadAsItWasWritten)
{
    const PropertyList value(PropertyList::Dictionary{
        {"familyName", PropertyList::Dictionary{{"Alpha-Bold", "Alpha"}}}, {"disabled", true}});
    subject->addFile("/UserFonts.plist", value);
    const auto reading = files().readPropertyList("/UserFonts.plist");
    EXPECT_EQ(reading.value, value);
    EXPECT_EQ(reading.error, "");
}

TEST_P(FileSystemContract, AReplacedFileIsReadAfresh)
{
    subject->addFile("/file", PropertyList(1));
    EXPECT_EQ(files().readPropertyList("/file").value, PropertyList(1));
    subject->addFile("/file", PropertyList(2));
    EXPECT_EQ(files().readPropertyList("/file").value, PropertyList(2));
}

TEST_P(FileSystemContract, WhatCannotBeReadHasAnErrorAndNoValue)
{
    subject->addMalformedFile("/malformed");
    subject->addDirectory("/directory");
    for (const char* path : {"/malformed", "/directory", "/absent", "/malformed/below"}) {
        const auto reading = files().readPropertyList(path);
        EXPECT_EQ(reading.value, std::nullopt) << path;
        EXPECT_NE(reading.error, "") << path;
    }
}

TEST_P(FileSystemContract, ContentsAreNamesInOrderOfTheirBytes)
{
    subject->addFile("/fonts/b", PropertyList());
    subject->addFile("/fonts/B", PropertyList());
    subject->addFile("/fonts/.hidden", PropertyList());
    subject->addFile("/fonts/a/below", PropertyList());
    subject->addDirectory("/fonts/a!");
    EXPECT_EQ(files().contentsOfDirectory("/fonts"),
              (std::vector<std::string>{".hidden", "B", "a", "a!", "b"}));
    EXPECT_EQ(files().contentsOfDirectory("/fonts/"), files().contentsOfDirectory("/fonts"));
    EXPECT_EQ(files().contentsOfDirectory("/fonts/a!"), std::vector<std::string>());
}

TEST_P(FileSystemContract, WhatIsNoDirectoryCannotBeListed)
{
    subject->addFile("/file", PropertyList());
    EXPECT_EQ(files().contentsOfDirectory("/file"), std::nullopt);
    EXPECT_EQ(files().contentsOfDirectory("/absent"), std::nullopt);
}

constexpr const char* tree = "/var/fonts/";

TEST_P(FileSystemContract, AnItemBelowTheTreeIsDeletedAlone)
{
    subject->addFile("/var/fonts/x/a", PropertyList());
    subject->addFile("/var/fonts/x/ab", PropertyList());
    const auto deletion = files().deletionBelow(tree);
    EXPECT_EQ(deletion->removeItem("/var/fonts/x/a"), std::nullopt);
    EXPECT_FALSE(files().exists("/var/fonts/x/a"));
    EXPECT_TRUE(files().exists("/var/fonts/x/ab"));
    EXPECT_NE(deletion->removeItem("/var/fonts/x/a"), std::nullopt) << "it is gone already";
}

TEST_P(FileSystemContract, ADirectoryIsDeletedWithItsContents)
{
    subject->addFile("/var/fonts/x/deep/er/a", PropertyList());
    subject->addFile("/var/fonts/x/deep/b", PropertyList());
    subject->addDirectory("/var/fonts/x/deep/empty");
    subject->addFile("/var/fonts/x/deeper", PropertyList());
    const auto deletion = files().deletionBelow(tree);
    EXPECT_EQ(deletion->removeItem("/var/fonts/x/deep"), std::nullopt);
    EXPECT_EQ(files().contentsOfDirectory("/var/fonts/x"), std::vector<std::string>{"deeper"});
}

TEST_P(FileSystemContract, BlankNamesDotsAndFinalSlashesInAPathMeanNothing)
{
    subject->addFile("/var/fonts/x/a", PropertyList());
    subject->addFile("/var/fonts/x/b", PropertyList());
    const auto deletion = files().deletionBelow(tree);
    EXPECT_EQ(deletion->removeItem("/var/fonts//x/./a"), std::nullopt);
    EXPECT_EQ(deletion->removeItem("/var/fonts/x/b//"), std::nullopt);
    EXPECT_EQ(files().contentsOfDirectory("/var/fonts/x"), std::vector<std::string>());
}

TEST_P(FileSystemContract, NothingOutsideTheTreeIsEverDeleted)
{
    const std::vector<std::string> sentinels{"/var/sentinel", "/var/fonts/x/a", "/var/fonts2/a"};
    for (const auto& sentinel : sentinels) {
        subject->addFile(sentinel, PropertyList());
    }
    const auto deletion = files().deletionBelow(tree);
    for (const auto& path : std::vector<std::string>{
             "/var/sentinel", "/var/fonts2/a", "/var/fonts/../sentinel", "/var/fonts/x/../../sentinel",
             "/var/fonts/x/../x/a", "/var/fonts/..", "/var/fonts", "/var/fonts/", "/var/fonts//",
             "/var/fonts/.", "", "/", "var/fonts/x/a", "x/a", std::string("/var/fonts/x/a\0", 15),
             std::string("/var/fonts/x/a\0/b", 17), "/var/fonts/x/a/b",
             "/var/fonts/" + std::string(100'000, 'n'), "/var/fonts/absent/a"}) {
        EXPECT_NE(deletion->removeItem(path), std::nullopt) << path.substr(0, 100);
        deletion->removeEmptyDirectory(path);
    }
    for (const auto& sentinel : sentinels) {
        EXPECT_TRUE(files().exists(sentinel)) << sentinel;
    }
}

TEST_P(FileSystemContract, OnlyAnEmptyDirectoryIsDeletedAsOne)
{
    subject->addDirectory("/var/fonts/empty/emptier");
    subject->addFile("/var/fonts/x/a", PropertyList());
    subject->addDirectory("/var/elsewhere");
    const auto deletion = files().deletionBelow(tree);
    for (const char* path : {"/var/fonts/x", "/var/fonts/x/a", "/var/fonts/empty", "/var/fonts",
                             "/var/elsewhere", "/var/fonts/x/../../elsewhere", "/var/fonts/absent", ""}) {
        deletion->removeEmptyDirectory(path);
    }
    EXPECT_TRUE(files().exists("/var/fonts/x/a"));
    EXPECT_TRUE(files().exists("/var/fonts/empty/emptier"));
    EXPECT_TRUE(files().exists("/var/elsewhere"));
    deletion->removeEmptyDirectory("/var/fonts/empty/emptier");
    EXPECT_FALSE(files().exists("/var/fonts/empty/emptier"));
    deletion->removeEmptyDirectory("/var/fonts/empty");
    EXPECT_FALSE(files().exists("/var/fonts/empty"));
}

TEST_P(FileSystemContract, TheTreeItselfGoesAsAnEmptyDirectoryAndNothingAboveIt)
{
    subject->addDirectory("/var/fonts");
    const auto deletion = files().deletionBelow(tree);
    deletion->removeEmptyDirectory("/var/fonts");
    EXPECT_FALSE(files().exists("/var/fonts"));
    deletion->removeEmptyDirectory("/var");
    EXPECT_TRUE(files().exists("/var"));
    EXPECT_NE(deletion->removeItem("/var/fonts/a"), std::nullopt);
}

TEST_P(FileSystemContract, ATreeThatIsNotThereFailsEveryDeletion)
{
    const auto deletion = files().deletionBelow(tree);
    EXPECT_NE(deletion->removeItem("/var/fonts/x/a"), std::nullopt);
    deletion->removeEmptyDirectory("/var/fonts/x");
    deletion->removeEmptyDirectory("/var/fonts");
}

INSTANTIATE_TEST_SUITE_P(, FileSystemContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
