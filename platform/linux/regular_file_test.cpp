#include "platform/linux/regular_file.h"
#include "platform/linux/scratch_directory.h"

#include <cerrno>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>
#include <linux/openat2.h>
#include <sys/stat.h>

namespace typhon {
namespace {

TEST(RegularFile, OpensAFileAndWhatALinkLeadsTo)
{
    const ScratchDirectory scratch;
    scratch.writeFile("/file", "contents");
    std::filesystem::create_symlink("file", scratch.real("/link"));
    for (const char* name : {"/file", "/link"}) {
        const auto opened = openRegularFile(scratch.real(name));
        ASSERT_EQ(opened.error, 0) << name;
        const auto contents = readWhole(opened.file.get(), 100);
        EXPECT_EQ(std::string(contents.bytes.begin(), contents.bytes.end()), "contents");
    }
}

TEST(RegularFile, RefusesEverythingElseWithoutOpeningIt)
{
    const ScratchDirectory scratch;
    ASSERT_EQ(::mkfifo(scratch.real("/pipe").c_str(), 0600), 0);
    EXPECT_EQ(openRegularFile(scratch.real("/pipe")).error, EINVAL);
    EXPECT_EQ(openRegularFile(scratch.real("/pipe")).errorText(), "not a regular file");
    EXPECT_EQ(openRegularFile("/dev/null").error, EINVAL);
    EXPECT_EQ(openRegularFile(scratch.path()).error, EISDIR);
    EXPECT_EQ(openRegularFile(scratch.real("/absent")).error, ENOENT);
}

TEST(RegularFile, KeepsToTheWayItWasTold)
{
    const ScratchDirectory scratch;
    scratch.writeFile("/file", "contents");
    std::filesystem::create_symlink(scratch.real("/file"), scratch.real("/link"));
    EXPECT_EQ(openRegularFile(scratch.real("/file"), AT_FDCWD, RESOLVE_NO_SYMLINKS).error, 0);
    EXPECT_EQ(openRegularFile(scratch.real("/link"), AT_FDCWD, RESOLVE_NO_SYMLINKS).error, ELOOP);
}

TEST(RegularFile, ReadsUpToTheLimitAndNoMore)
{
    const ScratchDirectory scratch;
    scratch.writeFile("/file", std::string(100'000, 'x'));
    EXPECT_EQ(readWhole(openRegularFile(scratch.real("/file")).file.get(), 100'000).bytes.size(), 100'000u);
    const auto tooLarge = readWhole(openRegularFile(scratch.real("/file")).file.get(), 99'999);
    EXPECT_EQ(tooLarge.error, EFBIG);
    EXPECT_TRUE(tooLarge.bytes.empty());
}

TEST(FileIdentity, DiffersBetweenFilesAndAfterAChange)
{
    const ScratchDirectory scratch;
    scratch.writeFile("/a", "one");
    scratch.writeFile("/b", "one");
    const auto identity = [&](const char* name) {
        return FileIdentity(openRegularFile(scratch.real(name)).status);
    };
    const auto before = identity("/a");
    EXPECT_EQ(before, identity("/a"));
    EXPECT_NE(before, identity("/b"));
    scratch.writeFile("/a", "three");
    EXPECT_NE(before, identity("/a"));
}

TEST(FileIdentity, IsUnsettledWhenTheFileChangedThisVeryMoment)
{
    struct stat status {};
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME_COARSE, &now);
    status.st_ctim = {.tv_sec = now.tv_sec + 10, .tv_nsec = 0};
    EXPECT_FALSE(FileIdentity(status).isSettled());
    status.st_ctim = {.tv_sec = now.tv_sec - 10, .tv_nsec = 0};
    EXPECT_TRUE(FileIdentity(status).isSettled());
}

}  // namespace
}  // namespace typhon
