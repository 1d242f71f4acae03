#include "platform/linux/large_values.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"

#include <array>
#include <thread>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {
namespace {

ino_t inodeOf(const FileDescriptor& file)
{
    struct stat status {};
    EXPECT_EQ(::fstat(file.get(), &status), 0);
    return status.st_ino;
}

PropertyList listOf(std::size_t count)
{
    PropertyList::Array elements;
    for (std::size_t number = 0; number < count; ++number) {
        elements.emplace_back("element number " + std::to_string(number));
    }
    return PropertyList(std::move(elements));
}

TEST(MemoryFile, IsSealedAndReadBack)
{
    const std::vector<std::uint8_t> bytes{1, 2, 3};
    const auto file = sealedMemoryFile(bytes);
    ASSERT_TRUE(file);
    EXPECT_EQ(contentsOfSealedMemoryFile(file.get(), 3), bytes);
    EXPECT_EQ(contentsOfSealedMemoryFile(file.get(), 2), std::nullopt);
    EXPECT_LT(::pwrite(file.get(), "x", 1, 0), 0);
    EXPECT_LT(::ftruncate(file.get(), 0), 0);
    const auto again = reopenedReadOnly(file.get());
    EXPECT_EQ(inodeOf(again), inodeOf(file));
    EXPECT_EQ(::fcntl(again.get(), F_GETFL) & O_ACCMODE, O_RDONLY);
    EXPECT_EQ(contentsOfSealedMemoryFile(STDERR_FILENO, 100), std::nullopt);
}

TEST(LargeValues, SmallOnesStayInline)
{
    LargeValues values;
    EXPECT_FALSE(values.memoryFileFor(PropertyList(7)));
    EXPECT_FALSE(values.memoryFileFor(listOf(100)));
    EXPECT_FALSE(values.memoryFileFor(listOf(1000)));
    EXPECT_EQ(values.count(), 0U);
}

TEST(LargeValues, TheLimitIsTheSizeOfTheBinaryForm)
{
    LargeValues values;
    const auto stringOf = [](std::size_t binarySize) {
        const auto overhead = writeBinaryPropertyList(PropertyList(std::string(60000, 'x'))).size() - 60000;
        return PropertyList(std::string(binarySize - overhead, 'x'));
    };
    EXPECT_FALSE(values.memoryFileFor(stringOf(LargeValues::largestInlineBytes)));
    EXPECT_TRUE(values.memoryFileFor(stringOf(LargeValues::largestInlineBytes + 1)));
}

TEST(LargeValues, EachIsEncodedOnceForAllItsReceivers)
{
    LargeValues values;
    const auto large = listOf(10000);
    const auto copy = large;
    const auto first = values.memoryFileFor(large);
    const auto second = values.memoryFileFor(copy);
    ASSERT_TRUE(first);
    ASSERT_TRUE(second);
    EXPECT_EQ(inodeOf(first), inodeOf(second));
    ::lseek(first.get(), 10, SEEK_SET);
    EXPECT_EQ(::lseek(second.get(), 0, SEEK_CUR), 0);
    EXPECT_NE(inodeOf(values.memoryFileFor(listOf(10000))), inodeOf(first)) << "another value, though equal";
    const auto bytes = contentsOfSealedMemoryFile(first.get(), 10 << 20);
    ASSERT_TRUE(bytes);
    EXPECT_EQ(readPropertyList(*bytes).value, large);
}

TEST(LargeValues, ThreadsShareOneEncoding)
{
    LargeValues values;
    const auto large = listOf(20000);
    std::array<FileDescriptor, 4> files;
    std::vector<std::thread> threads;
    for (auto& file : files) {
        threads.emplace_back([&values, &large, &file] { file = values.memoryFileFor(large); });
    }
    for (auto& thread : threads) {
        thread.join();
    }
    for (const auto& file : files) {
        EXPECT_EQ(inodeOf(file), inodeOf(files[0]));
    }
}

TEST(LargeValues, TheCacheIsBoundedAndForgetsValuesThatAreGone)
{
    LargeValues values(3);
    std::vector<PropertyList> kept;
    for (int number = 0; number < 10; ++number) {
        kept.push_back(listOf(10000));
        EXPECT_TRUE(values.memoryFileFor(kept.back()));
        EXPECT_LE(values.count(), 3U);
    }
    kept.clear();
    EXPECT_TRUE(values.memoryFileFor(listOf(10000)));
    EXPECT_EQ(values.count(), 1U);

    LargeValues few(64, 1);
    const auto one = listOf(10000);
    const auto other = listOf(10000);
    EXPECT_TRUE(few.memoryFileFor(one));
    EXPECT_TRUE(few.memoryFileFor(other));
    EXPECT_EQ(few.count(), 1U);
}

TEST(LargeValues, DeepOnesAreLargeHoweverSmall)
{
    LargeValues values;
    PropertyList value(1);
    for (unsigned depth = 0; depth < LargeValues::deepestInline; ++depth) {
        value = PropertyList(PropertyList::Array{value});
    }
    EXPECT_FALSE(values.memoryFileFor(value));
    EXPECT_TRUE(values.memoryFileFor(PropertyList(PropertyList::Array{value})));
}

}  // namespace
}  // namespace typhon
