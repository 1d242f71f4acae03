#include "platform/linux/linux_file_system.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon {
namespace {

constexpr const char* emptyDictionary = "<plist version=\"1.0\"><dict/></plist>";

class LinuxFileSystemTest : public testing::Test {
protected:
    ScratchDirectory scratch;
    LinuxFileSystem files{RootDirectory(scratch.path())};
};

TEST_F(LinuxFileSystemTest, ReadsWhatALinkLeadsTo)
{
    scratch.writeFile("/file", emptyDictionary);
    std::filesystem::create_symlink("file", scratch.real("/link"));
    EXPECT_EQ(files.readPropertyList("/link").value, PropertyList());
}

TEST_F(LinuxFileSystemTest, APipeIsAnErrorAndNotAWait)
{
    ASSERT_EQ(::mkfifo(scratch.real("/pipe").c_str(), 0600), 0);
    EXPECT_EQ(files.readPropertyList("/pipe").error, "not a regular file");
    EXPECT_TRUE(files.exists("/pipe"));
}

TEST_F(LinuxFileSystemTest, DevicesAreErrors)
{
    LinuxFileSystem machine{RootDirectory()};
    EXPECT_EQ(machine.readPropertyList("/dev/zero").error, "not a regular file");
}

TEST_F(LinuxFileSystemTest, AHugeFileIsAnErrorAndIsNotReadWhole)
{
    scratch.writeFile("/huge", "bplist00");
    std::filesystem::resize_file(scratch.real("/huge"), std::uintmax_t(1) << 40);
    const auto reading = files.readPropertyList("/huge");
    EXPECT_EQ(reading.value, std::nullopt);
    EXPECT_EQ(reading.error, "larger than 268435456 bytes");
}

TEST_F(LinuxFileSystemTest, WhatIsNoAbsolutePathIsNotThere)
{
    scratch.writeFile("/file", emptyDictionary);
    for (const auto& path : {std::string("file"), std::string(), std::string("/file\0x", 7)}) {
        EXPECT_FALSE(files.exists(path));
        EXPECT_EQ(files.readPropertyList(path).error, "not an absolute path");
        EXPECT_EQ(files.contentsOfDirectory(path), std::nullopt);
    }
}

/// As a user without permission: the test may run as root, whom no permission stops.
TEST_F(LinuxFileSystemTest, AFileThatMayNotBeReadIsAnError)
{
    scratch.writeFile("/file", emptyDictionary);
    std::filesystem::permissions(scratch.path(), std::filesystem::perms(0755));
    std::filesystem::permissions(scratch.real("/file"), std::filesystem::perms::none);
    const pid_t child = ::fork();
    if (child == 0) {
        if (::geteuid() == 0 && ::setresuid(65534, 65534, 65534) != 0) {
            ::_exit(10);
        }
        ::_exit(files.readPropertyList("/file").error == "Permission denied" && files.exists("/file") ? 0
                                                                                                      : 1);
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    EXPECT_EQ(status, 0);
}

}  // namespace
}  // namespace typhon
