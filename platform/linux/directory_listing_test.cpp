#include "platform/linux/directory_listing.h"
#include "platform/linux/scratch_directory.h"

#include <cerrno>
#include <filesystem>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class DirectoryListingTest : public testing::Test {
protected:
    DirectoryListing list(std::size_t limit = 10'000) const { return listDirectory(directory.get(), limit); }

    ScratchDirectory scratch;
    FileDescriptor directory{::open(scratch.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC)};
};

TEST_F(DirectoryListingTest, TellsDirectoriesFromAllElseInOrder)
{
    scratch.writeFile("/b.ttf", "");
    scratch.writeFile("/.a", "");
    scratch.writeFile("/folder/inside", "");
    std::filesystem::create_symlink("folder", scratch.real("/link"));
    const auto listing = list();
    EXPECT_THAT(listing.files, ElementsAre(".a", "b.ttf", "link"));
    EXPECT_THAT(listing.directories, ElementsAre("folder"));
    EXPECT_FALSE(listing.isCut);
    EXPECT_EQ(listing.error, 0);
}

TEST_F(DirectoryListingTest, BeginsAtTheBeginningEachTimeAndSeesWhatCame)
{
    EXPECT_THAT(list().files, IsEmpty());
    scratch.writeFile("/new", "");
    EXPECT_THAT(list().files, ElementsAre("new"));
    EXPECT_THAT(list().files, ElementsAre("new"));
}

TEST_F(DirectoryListingTest, HoldsMoreThanTheKernelTellsAtOnceUpToItsLimit)
{
    constexpr std::size_t count = 1'000;
    for (std::size_t number = 0; number < count; ++number) {
        scratch.writeFile("/" + std::string(200, 'x') + std::to_string(number), "");
    }
    EXPECT_EQ(list().files.size(), count);
    EXPECT_FALSE(list(count).isCut);
    const auto cut = list(count - 1);
    EXPECT_EQ(cut.files.size(), count - 1);
    EXPECT_TRUE(cut.isCut);
}

TEST_F(DirectoryListingTest, SaysWhyThereIsNone)
{
    EXPECT_EQ(listDirectory(-1, 1).error, EBADF);
    scratch.writeFile("/file", "");
    const FileDescriptor file(::open(scratch.real("/file").c_str(), O_RDONLY | O_CLOEXEC));
    EXPECT_EQ(listDirectory(file.get(), 1).error, ENOTDIR);
}

}  // namespace
}  // namespace typhon
