#include "platform/linux/locked_mount.h"
#include "testing/child_process.h"
#include "testing/scratch_folder.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/mount.h>
#include <sched.h>
#include <sys/syscall.h>

namespace typhon {
namespace {

using testing::ChildProcess;
using testing::ScratchFolder;

struct LockedMountTest : ::testing::Test {
    ScratchFolder folder;
    const std::string real = folder.write("/tree/a.ttf", "contents", 0666);
    const FileDescriptor directory{::open((folder.path + "/tree").c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC)};
    const FileDescriptor mount = lockedReadOnlyMount(directory.get());
    const FileDescriptor file{::openat(mount.get(), "a.ttf", O_RDONLY | O_CLOEXEC)};

    /// What a child that unshares a user and a mount namespace of its own gets from `attempt`: an errno, or
    /// 0.
    static int inOwnNamespaces(const std::function<bool()>& attempt)
    {
        ChildProcess child([&](int stream) {
            int result = ::unshare(CLONE_NEWUSER | CLONE_NEWNS) == 0 ? 0 : 999;
            if (result == 0 && !attempt()) {
                result = errno;
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
};

TEST_F(LockedMountTest, ShowsTheFiles)
{
    ASSERT_TRUE(mount);
    ASSERT_TRUE(file);
    char text[16] = {};
    EXPECT_EQ(::read(file.get(), text, sizeof text), 8);
    EXPECT_STREQ(text, "contents");
    folder.write("/tree/later.ttf", "later");
    EXPECT_TRUE(FileDescriptor(::openat(mount.get(), "later.ttf", O_RDONLY | O_CLOEXEC)));
}

TEST_F(LockedMountTest, LetsNothingBeWritten)
{
    ASSERT_TRUE(file);
    const auto again = "/proc/self/fd/" + std::to_string(file.get());
    EXPECT_FALSE(FileDescriptor(::open(again.c_str(), O_RDWR | O_CLOEXEC)));
    EXPECT_EQ(errno, EROFS);
    EXPECT_FALSE(FileDescriptor(::open(again.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC)));
    EXPECT_EQ(errno, EROFS);
    EXPECT_NE(::fchmod(file.get(), 0777), 0);
    EXPECT_EQ(errno, EROFS);
    EXPECT_NE(::futimens(file.get(), nullptr), 0);
    EXPECT_NE(::unlinkat(mount.get(), "a.ttf", 0), 0);
    EXPECT_FALSE(FileDescriptor(::openat(mount.get(), "new", O_WRONLY | O_CREAT | O_CLOEXEC, 0600)));
}

TEST_F(LockedMountTest, CannotBeMadeWritableInAnotherUserNamespace)
{
    ASSERT_TRUE(mount);
    mount_attr clear{};
    clear.attr_clr = MOUNT_ATTR_RDONLY;
    for (const int descriptor : {mount.get(), file.get()}) {
        EXPECT_NE(inOwnNamespaces([&] {
                      return ::syscall(SYS_mount_setattr, descriptor, "", AT_EMPTY_PATH, &clear,
                                       sizeof clear) == 0;
                  }),
                  0);
        EXPECT_NE(inOwnNamespaces([&] {
                      const int clone = static_cast<int>(
                          ::syscall(SYS_open_tree, descriptor, "", OPEN_TREE_CLONE | AT_EMPTY_PATH));
                      return clone >= 0 && ::syscall(SYS_mount_setattr, clone, "", AT_EMPTY_PATH, &clear,
                                                     sizeof clear) == 0;
                  }),
                  0);
    }
    EXPECT_EQ(inOwnNamespaces([] { return true; }), 0);
}

TEST_F(LockedMountTest, HasNothingAboveIt)
{
    ASSERT_TRUE(mount);
    folder.write("/secret", "secret");
    const FileDescriptor above(::openat(mount.get(), "..", O_PATH | O_DIRECTORY | O_CLOEXEC));
    EXPECT_FALSE(FileDescriptor(::openat(above.get(), "secret", O_RDONLY | O_CLOEXEC)));
    EXPECT_FALSE(FileDescriptor(::openat(mount.get(), "../secret", O_RDONLY | O_CLOEXEC)));
}

TEST_F(LockedMountTest, LeavesTheDirectoryItselfAsItWas)
{
    ASSERT_TRUE(mount);
    folder.write("/tree/new.ttf", "new");
    EXPECT_TRUE(std::filesystem::exists(folder.path + "/tree/new.ttf"));
    std::filesystem::remove_all(folder.path + "/tree");
    EXPECT_FALSE(std::filesystem::exists(folder.path + "/tree"));
}

TEST_F(LockedMountTest, OfWhatIsNoDirectoryIsNone)
{
    EXPECT_FALSE(lockedReadOnlyMount(file.get()));
    EXPECT_FALSE(lockedReadOnlyMount(-1));
}

}  // namespace
}  // namespace typhon
