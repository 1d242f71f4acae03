#include "platform/linux/durable_file.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/scratch_directory.h"

#include <chrono>
#include <csignal>
#include <filesystem>
#include <span>
#include <string_view>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;
using testing::HasSubstr;
using testing::UnorderedElementsAre;

std::vector<std::uint8_t> bytes(std::string_view text)
{
    return {text.begin(), text.end()};
}

std::vector<std::string> namesIn(const ScratchDirectory& scratch)
{
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(scratch.path())) {
        names.push_back(entry.path().filename().string());
    }
    return names;
}

TEST(ReplaceFile, MakesAndReplacesWithTheGivenPermissions)
{
    const ScratchDirectory scratch;
    EXPECT_EQ(replaceFile(scratch.real("/file"), bytes("one"), 0640), std::nullopt);
    EXPECT_EQ(replaceFile(scratch.real("/file"), bytes("two"), 0600), std::nullopt);
    EXPECT_EQ(scratch.readFile("/file"), "two");
    struct stat status {};
    ASSERT_EQ(::stat(scratch.real("/file").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0600u);
    EXPECT_THAT(namesIn(scratch), UnorderedElementsAre("file"));
}

TEST(ReplaceFile, ReplacesWhatACrashedWriterLeft)
{
    const ScratchDirectory scratch;
    scratch.writeFile("/file", "one");
    scratch.writeFile("/file.new", "half of tw");
    EXPECT_EQ(replaceFile(scratch.real("/file"), bytes("three"), 0600), std::nullopt);
    EXPECT_EQ(scratch.readFile("/file"), "three");
    EXPECT_THAT(namesIn(scratch), UnorderedElementsAre("file"));
}

TEST(ReplaceFile, DoesNotWriteThroughALinkInPlaceOfTheNewFile)
{
    const ScratchDirectory scratch;
    scratch.writeFile("/victim", "untouched");
    std::filesystem::create_symlink("victim", scratch.real("/file.new"));
    EXPECT_EQ(replaceFile(scratch.real("/file"), bytes("new"), 0600), std::nullopt);
    EXPECT_EQ(scratch.readFile("/victim"), "untouched");
    EXPECT_EQ(scratch.readFile("/file"), "new");
}

FileIdentity identityOf(const std::string& path)
{
    struct stat status {};
    EXPECT_EQ(::stat(path.c_str(), &status), 0);
    return FileIdentity(status);
}

TEST(ReplaceFile, GivesATimeThatNoLaterChangeHas)
{
    const ScratchDirectory scratch;
    const auto path = scratch.real("/file");
    for (int round = 0; round < 200; ++round) {
        ASSERT_EQ(replaceFile(path, bytes("before"), 0600), std::nullopt);
        const auto before = identityOf(path);
        EXPECT_TRUE(before.hasSettledContents());
        const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CLOEXEC));
        ASSERT_EQ(::pwrite(file.get(), "after!", 6, 0), 6);
        EXPECT_FALSE(identityOf(path).hasContentsOf(before));
    }
}

TEST(ReplaceFile, LeavesTheOldFileAndSaysWhyWhenItFails)
{
    const ScratchDirectory scratch;
    scratch.writeFile("/file/inside", "a directory is in the way");
    EXPECT_THAT(replaceFile(scratch.real("/file"), bytes("new"), 0600).value_or(""),
                HasSubstr("cannot replace " + scratch.real("/file")));
    EXPECT_THAT(namesIn(scratch), UnorderedElementsAre("file"));
    EXPECT_THAT(replaceFile(scratch.real("/absent/file"), bytes("new"), 0600).value_or(""),
                HasSubstr("No such file or directory"));
}

TEST(MakeDirectories, MakesThoseAboveAndAcceptsThoseThere)
{
    const ScratchDirectory scratch;
    EXPECT_EQ(makeDirectories(scratch.real("/a/b/c"), 0755), std::nullopt);
    EXPECT_EQ(makeDirectories(scratch.real("/a/b/c"), 0755), std::nullopt);
    EXPECT_TRUE(std::filesystem::is_directory(scratch.real("/a/b/c")));
    scratch.writeFile("/a/file", "");
    EXPECT_THAT(makeDirectories(scratch.real("/a/file/d"), 0755).value_or(""), HasSubstr("/a/file"));
}

TEST(MakeDirectories, GivesThePermissionsAskedForWhateverTheUmask)
{
    const ScratchDirectory scratch;
    const mode_t before = ::umask(0077);
    EXPECT_EQ(makeDirectories(scratch.real("/a/b"), 0755), std::nullopt);
    ::umask(before);
    for (const char* name : {"/a", "/a/b"}) {
        struct stat status {};
        ASSERT_EQ(::stat(scratch.real(name).c_str(), &status), 0);
        EXPECT_EQ(status.st_mode & 07777, 0755u) << name;
    }
}

TEST(FileLock, KeepsOthersOutWithinItsPatience)
{
    const ScratchDirectory scratch;
    {
        const FileLock held(scratch.real("/lock"));
        EXPECT_EQ(held.error(), std::nullopt);
        EXPECT_THAT(FileLock(scratch.real("/lock"), 0ms).error().value_or(""),
                    HasSubstr("another process holds"));
    }
    EXPECT_EQ(FileLock(scratch.real("/lock"), 0ms).error(), std::nullopt);
}

TEST(FileLock, IsLetGoOfWhenItsHolderIsKilled)
{
    const ScratchDirectory scratch;
    int ready[2];
    ASSERT_EQ(::pipe(ready), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        const FileLock held(scratch.real("/lock"));
        const char answer = held.error() ? 'n' : 'y';
        ::write(ready[1], &answer, 1) == 1 ? ::pause() : 0;
        ::_exit(1);
    }
    char answer = 0;
    ASSERT_EQ(::read(ready[0], &answer, 1), 1);
    ASSERT_EQ(answer, 'y');
    EXPECT_TRUE(FileLock(scratch.real("/lock"), 0ms).error());
    ::kill(child, SIGKILL);
    ::waitpid(child, nullptr, 0);
    EXPECT_EQ(FileLock(scratch.real("/lock"), 0ms).error(), std::nullopt);
    ::close(ready[0]);
    ::close(ready[1]);
}

TEST(DirectoryOf, IsThePartBeforeTheLastSlash)
{
    EXPECT_EQ(directoryOf("/a/b"), "/a");
    EXPECT_EQ(directoryOf("/a"), "/");
}

}  // namespace
}  // namespace typhon
