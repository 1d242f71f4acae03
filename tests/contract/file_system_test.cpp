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

INSTANTIATE_TEST_SUITE_P(, FileSystemContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
