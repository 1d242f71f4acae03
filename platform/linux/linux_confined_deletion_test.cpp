#include "platform/linux/linux_confined_deletion.h"
#include "platform/linux/scratch_directory.h"
#include "testing/child_process.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {
namespace {

namespace fs = std::filesystem;
using testing::ChildProcess;

/// A tree, and a sentinel outside of it that has to survive every test.
class LinuxConfinedDeletionTest : public ::testing::Test {
protected:
    LinuxConfinedDeletionTest()
    {
        scratch.writeFile("/outside/sentinel", "alive");
        scratch.writeFile("/outside/folder/sentinel", "alive");
        scratch.writeFile("/tree/x/a", "a font");
    }
    ~LinuxConfinedDeletionTest() override
    {
        EXPECT_EQ(scratch.readFile("/outside/sentinel"), "alive");
        EXPECT_EQ(scratch.readFile("/outside/folder/sentinel"), "alive");
    }

    std::string remove(const std::string& path)
    {
        return LinuxConfinedDeletion(root, "/tree/").removeItem(path).value_or("");
    }
    bool exists(const std::string& path) const { return fs::exists(fs::symlink_status(scratch.real(path))); }
    void link(const std::string& at, const std::string& target) const
    {
        fs::create_symlink(target, scratch.real(at));
    }

    /// What `check` says in a child that may mount what it likes for itself: 0 for true, 1 for false, an
    /// errno where the mounting failed.
    int withMount(const std::string& what, const std::string& at, const std::function<bool()>& check) const
    {
        ChildProcess child([&](int stream) {
            int result = ::unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0 ||
                                 ::mount(scratch.real(what).c_str(), scratch.real(at).c_str(), nullptr,
                                         MS_BIND, nullptr) != 0
                             ? 1000 + errno
                             : 0;
            if (result == 0) {
                result = check() ? 0 : 1;
            }
            if (::write(stream, &result, sizeof result) != sizeof result) {
                ::_exit(1);
            }
        });
        const auto answer = child.read();
        int result = 998;
        std::memcpy(&result, answer.data(), std::min(answer.size(), sizeof result));
        return result;
    }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
};

TEST_F(LinuxConfinedDeletionTest, ALinkOnTheWayIsNotFollowed)
{
    link("/tree/out", "../outside");
    link("/tree/absolute", scratch.real("/outside"));
    link("/tree/up", "..");
    link("/tree/within", "x");
    EXPECT_NE(remove("/tree/out/sentinel"), "");
    EXPECT_NE(remove("/tree/absolute/folder"), "");
    EXPECT_NE(remove("/tree/up/outside/sentinel"), "");
    EXPECT_NE(remove("/tree/up/outside"), "");
    EXPECT_NE(remove("/tree/within/a"), "");
    EXPECT_TRUE(exists("/tree/x/a"));
}

TEST_F(LinuxConfinedDeletionTest, AMagicLinkOnTheWayIsNotFollowed)
{
    link("/tree/self", "/proc/self/cwd");
    link("/tree/root", "/proc/self/root");
    EXPECT_NE(remove("/tree/self/a"), "");
    EXPECT_NE(remove("/tree/root" + scratch.real("/outside/sentinel")), "");
}

TEST_F(LinuxConfinedDeletionTest, ALinkAsTheLastComponentIsItselfRemoved)
{
    link("/tree/x/file", "../../outside/sentinel");
    link("/tree/x/folder", "../../outside/folder");
    link("/tree/x/dangling", "nowhere");
    EXPECT_EQ(remove("/tree/x/file"), "");
    EXPECT_EQ(remove("/tree/x/folder/"), "") << "a final slash does not make it followed";
    EXPECT_EQ(remove("/tree/x/dangling"), "");
    EXPECT_FALSE(exists("/tree/x/file"));
    EXPECT_FALSE(exists("/tree/x/folder"));
    EXPECT_FALSE(exists("/tree/x/dangling"));
}

TEST_F(LinuxConfinedDeletionTest, LinksInADirectoryGoWithItAndNotWhereTheyLead)
{
    link("/tree/x/out", "../../outside");
    link("/tree/x/up", "../..");
    scratch.writeFile("/tree/x/deep/a", "a font");
    link("/tree/x/deep/out", scratch.real("/outside/folder"));
    EXPECT_EQ(remove("/tree/x"), "");
    EXPECT_FALSE(exists("/tree/x"));
}

TEST_F(LinuxConfinedDeletionTest, ALinkIsNoEmptyDirectory)
{
    fs::create_directories(scratch.real("/outside/empty"));
    link("/tree/empty", "../outside/empty");
    LinuxConfinedDeletion deletion(root, "/tree/");
    deletion.removeEmptyDirectory("/tree/empty");
    deletion.removeEmptyDirectory("/tree/empty/../../outside/empty");
    EXPECT_TRUE(exists("/tree/empty"));
    EXPECT_TRUE(exists("/outside/empty"));
}

TEST_F(LinuxConfinedDeletionTest, SpecialFilesGoWithoutBeingOpened)
{
    ASSERT_EQ(::mkfifo(scratch.real("/tree/x/pipe").c_str(), 0600), 0);
    EXPECT_EQ(remove("/tree/x/pipe"), "");
    ASSERT_EQ(::mkfifo(scratch.real("/tree/x/pipe").c_str(), 0600), 0);
    EXPECT_EQ(remove("/tree/x"), "");
    EXPECT_FALSE(exists("/tree/x"));
}

TEST_F(LinuxConfinedDeletionTest, AnotherHardLinkOfAFileStays)
{
    fs::create_hard_link(scratch.real("/outside/sentinel"), scratch.real("/tree/x/b"));
    EXPECT_EQ(remove("/tree/x/b"), "");
    EXPECT_FALSE(exists("/tree/x/b"));
}

TEST_F(LinuxConfinedDeletionTest, TheTreeMayLieBehindALink)
{
    fs::rename(scratch.real("/tree"), scratch.real("/elsewhere"));
    link("/tree", "elsewhere");
    EXPECT_EQ(remove("/tree/x/a"), "");
    EXPECT_FALSE(exists("/elsewhere/x/a"));
    LinuxConfinedDeletion deletion(root, "/tree/");
    deletion.removeEmptyDirectory("/tree/x");
    deletion.removeEmptyDirectory("/tree");
    EXPECT_TRUE(exists("/elsewhere")) << "the link is not the administrator's directory";
    EXPECT_TRUE(exists("/tree"));
}

TEST_F(LinuxConfinedDeletionTest, NestingIsBounded)
{
    const auto nested = [&](int depth) {
        std::string path = "/tree/deep";
        for (int level = 1; level < depth; ++level) {
            path += "/d";
        }
        fs::create_directories(scratch.real(path));
    };
    nested(100);
    EXPECT_EQ(remove("/tree/deep"), "");
    EXPECT_FALSE(exists("/tree/deep"));
    nested(101);
    EXPECT_EQ(remove("/tree/deep"), "directories nested more than 100 deep");
    EXPECT_TRUE(exists("/tree/deep"));
    EXPECT_NE(remove("/tree" + std::string(5000, '/') + "x" +
                     [] {
                         std::string way;
                         for (int level = 0; level < 3000; ++level) {
                             way += "/d";
                         }
                         return way;
                     }()),
              "");
}

TEST_F(LinuxConfinedDeletionTest, WhatCannotBeDeletedSaysWhy)
{
    EXPECT_EQ(remove("/tree/x/absent"), "No such file or directory");
    EXPECT_EQ(remove("/tree/x/a/below"), "Not a directory");
    EXPECT_EQ(remove("/tree/" + std::string(100'000, 'n')), "File name too long");
    EXPECT_EQ(remove("/tree/x/" + std::string(256, 'n')), "File name too long");
    EXPECT_EQ(remove("/tree/"), "this is the directory itself");
    EXPECT_EQ(remove("/tree/x/../x/a"), "not a plain path below /tree/");
    EXPECT_EQ(remove(std::string("/tree/x/a\0", 10)), "not a plain path below /tree/");
    EXPECT_EQ(LinuxConfinedDeletion(root, "/absent/").removeItem("/absent/a"), "No such file or directory");
}

TEST_F(LinuxConfinedDeletionTest, ADirectoryThatTookTheNameOfAnotherIsEntered)
{
    scratch.writeFile("/tree/y/a", "a font");
    LinuxConfinedDeletion deletion(root, "/tree/");
    EXPECT_EQ(deletion.removeItem("/tree/x/a"), std::nullopt);
    deletion.removeEmptyDirectory("/tree/x");
    fs::rename(scratch.real("/tree/y"), scratch.real("/tree/x"));
    EXPECT_EQ(deletion.removeItem("/tree/y/a"), "No such file or directory");
    EXPECT_EQ(deletion.removeItem("/tree/x/a"), std::nullopt);
}

TEST_F(LinuxConfinedDeletionTest, AMountPointIsNeitherCrossedNorRemoved)
{
    fs::create_directories(scratch.real("/tree/mounted"));
    EXPECT_EQ(withMount("/outside", "/tree/mounted",
                        [&] {
                            LinuxConfinedDeletion deletion(root, "/tree/");
                            deletion.removeEmptyDirectory("/tree/mounted");
                            deletion.removeEmptyDirectory("/tree/mounted/folder");
                            return remove("/tree/mounted/sentinel") == "Invalid cross-device link" &&
                                   remove("/tree/mounted/folder") != "" &&
                                   remove("/tree/mounted") == "Invalid cross-device link" &&
                                   exists("/tree/mounted/folder/sentinel");
                        }),
              0);
    EXPECT_TRUE(exists("/tree/mounted"));
}

TEST_F(LinuxConfinedDeletionTest, AMountPointDeepInADirectoryIsNotCrossed)
{
    fs::create_directories(scratch.real("/tree/x/deep/mounted"));
    EXPECT_EQ(withMount("/outside", "/tree/x/deep/mounted", [&] { return remove("/tree/x") != ""; }), 0);
    EXPECT_TRUE(exists("/tree/x/deep/mounted"));
}

TEST_F(LinuxConfinedDeletionTest, AMountedFileIsNotRemoved)
{
    EXPECT_EQ(withMount("/outside/sentinel", "/tree/x/a",
                        [&] { return remove("/tree/x/a") == "Device or resource busy"; }),
              0);
    EXPECT_TRUE(exists("/tree/x/a"));
}

TEST_F(LinuxConfinedDeletionTest, ATreeThatIsItselfAMountWorks)
{
    scratch.writeFile("/disk/a", "a font");
    EXPECT_EQ(withMount("/disk", "/tree", [&] { return remove("/tree/a").empty(); }), 0);
    EXPECT_FALSE(exists("/disk/a"));
    EXPECT_TRUE(exists("/tree/x/a"));
}

}  // namespace
}  // namespace typhon
