#include "platform/linux/file_descriptor.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"

#include <algorithm>
#include <string>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mman.h>
#include <unistd.h>

namespace typhon {
namespace {

using testing::HasSubstr;
using Array = PropertyList::Array;
using Bytes = std::vector<std::uint8_t>;
using Read = std::function<std::ptrdiff_t(std::span<std::uint8_t>)>;

Bytes xmlOf(const PropertyList& value)
{
    const auto text = writeXmlPropertyList(value);
    return {text.begin(), text.end()};
}

/// Gives at most `most` bytes at a time, and notes the largest request.
struct Source {
    Bytes bytes;
    std::size_t most;
    std::size_t at = 0;
    std::size_t largestRequest = 0;

    Read read()
    {
        return [this](std::span<std::uint8_t> block) -> std::ptrdiff_t {
            largestRequest = std::max(largestRequest, block.size());
            const auto count = std::min({block.size(), most, bytes.size() - at});
            std::copy_n(bytes.begin() + static_cast<std::ptrdiff_t>(at), count, block.begin());
            at += count;
            return static_cast<std::ptrdiff_t>(count);
        };
    }
};

FileDescriptor fileOf(const Bytes& bytes)
{
    FileDescriptor file(memfd_create("property list", MFD_CLOEXEC));
    EXPECT_EQ(write(file.get(), bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    EXPECT_EQ(lseek(file.get(), 0, SEEK_SET), 0);
    return file;
}

PropertyList large()
{
    Array strings;
    for (int index = 0; index < 20'000; ++index)
        strings.emplace_back("string number " + std::to_string(index));
    return strings;
}

TEST(PropertyListReaderTest, TellsTheFormsApart)
{
    const PropertyList value(Array{1, "two"});
    EXPECT_EQ(readPropertyList(xmlOf(value)).value, value);
    EXPECT_EQ(readPropertyList(writeBinaryPropertyList(value)).value, value);
}

TEST(PropertyListReaderTest, RefusesOtherVersionsOfTheBinaryForm)
{
    auto bytes = writeBinaryPropertyList(1);
    bytes[7] = '1';
    EXPECT_THAT(readPropertyList(bytes).error, HasSubstr("an unknown version of the binary form"));
    Source source{bytes, 1};
    EXPECT_THAT(readPropertyListFromStream(source.read()).error, HasSubstr("an unknown version"));
}

TEST(PropertyListReaderTest, RefusesNothingAtAll)
{
    EXPECT_FALSE(readPropertyList({}).value);
    Source source{{}, 1};
    EXPECT_FALSE(readPropertyListFromStream(source.read()).value);
}

TEST(PropertyListReaderTest, ReadsStreamsThatComeInPieces)
{
    const auto value = large();
    for (const std::size_t most : {1u, 7u, 4096u, 1u << 30}) {
        Source xml{xmlOf(value), most};
        EXPECT_EQ(readPropertyListFromStream(xml.read()).value, value);
        Source binary{writeBinaryPropertyList(value), most};
        EXPECT_EQ(readPropertyListFromStream(binary.read()).value, value);
    }
}

TEST(PropertyListReaderTest, ReadsXmlABlockAtATime)
{
    Source source{xmlOf(large()), 1u << 30};
    ASSERT_GT(source.bytes.size(), 128u << 10);
    EXPECT_TRUE(readPropertyListFromStream(source.read()).value);
    EXPECT_LE(source.largestRequest, 64u << 10);
}

TEST(PropertyListReaderTest, StopsReadingXmlThatIsRefused)
{
    Bytes bytes{'<', 'x', '>'};
    bytes.resize(10u << 20, ' ');
    Source source{bytes, 1u << 30};
    EXPECT_FALSE(readPropertyListFromStream(source.read()).value);
    EXPECT_LE(source.at, 64u << 10);
}

TEST(PropertyListReaderTest, ReadsInputsAroundTheSizeOfABlock)
{
    for (const std::size_t size : {65536u, 131072u}) {
        for (std::size_t length = size - 60; length < size + 4; ++length) {
            const PropertyList value(Data{Bytes(length, 1)});
            Source source{writeBinaryPropertyList(value), 1u << 30};
            EXPECT_EQ(readPropertyListFromStream(source.read()).value, value) << source.bytes.size();
        }
    }
    const auto overhead = xmlOf(std::string()).size();
    for (std::size_t length = 65536 - overhead - 3; length < 65536 - overhead + 4; ++length) {
        const PropertyList value(std::string(length, 'x'));
        Source source{xmlOf(value), 1u << 30};
        EXPECT_EQ(readPropertyListFromStream(source.read()).value, value) << source.bytes.size();
    }
}

TEST(PropertyListReaderTest, BoundsBytesInBothForms)
{
    for (const auto& bytes :
         {xmlOf(large()), writeBinaryPropertyList(large()), xmlOf(1), writeBinaryPropertyList(1)}) {
        const PropertyListLimits enough{.bytes = bytes.size()};
        const PropertyListLimits tooFew{.bytes = bytes.size() - 1};
        EXPECT_TRUE(readPropertyList(bytes, enough).value);
        EXPECT_THAT(readPropertyList(bytes, tooFew).error, HasSubstr("longer than"));
        Source allowed{bytes, 1000};
        EXPECT_TRUE(readPropertyListFromStream(allowed.read(), enough).value);
        Source refused{bytes, 1000};
        EXPECT_THAT(readPropertyListFromStream(refused.read(), tooFew).error, HasSubstr("longer than"));
    }
}

TEST(PropertyListReaderTest, AnEndlessInputIsCutOff)
{
    std::size_t given = 0;
    const auto binary = writeBinaryPropertyList(1);
    const Read endless = [&](std::span<std::uint8_t> block) {
        std::fill(block.begin(), block.end(), std::uint8_t{0});
        if (given == 0)
            std::copy(binary.begin(), binary.end(), block.begin());
        given += block.size();
        return static_cast<std::ptrdiff_t>(block.size());
    };
    const PropertyListLimits limits{.bytes = 1u << 20};
    EXPECT_THAT(readPropertyListFromStream(endless, limits).error, HasSubstr("longer than"));
    EXPECT_LE(given, limits.bytes + 1);
}

TEST(PropertyListReaderTest, InputErrorsAreReported)
{
    const Read failing = [](std::span<std::uint8_t>) -> std::ptrdiff_t { return -1; };
    EXPECT_EQ(readPropertyListFromStream(failing).error, "input error");
    for (const auto& bytes : {xmlOf(large()), writeBinaryPropertyList(large())}) {
        Source source{bytes, 1000};
        const auto read = source.read();
        const Read failingLater = [&](std::span<std::uint8_t> block) -> std::ptrdiff_t {
            return source.at > 100'000 ? -1 : read(block);
        };
        EXPECT_EQ(readPropertyListFromStream(failingLater).error, "input error");
    }
}

TEST(PropertyListReaderTest, ReadsDescriptorsFromTheirPresentOffset)
{
    for (const auto& bytes : {xmlOf(large()), writeBinaryPropertyList(large())}) {
        EXPECT_EQ(readPropertyListFromDescriptor(fileOf(bytes).get()).value, large());
        Bytes prefixed{'x', 'y', 'z'};
        prefixed.insert(prefixed.end(), bytes.begin(), bytes.end());
        const auto file = fileOf(prefixed);
        ASSERT_EQ(lseek(file.get(), 3, SEEK_SET), 3);
        EXPECT_EQ(readPropertyListFromDescriptor(file.get()).value, large());
    }
}

TEST(PropertyListReaderTest, DescriptorErrorsSayWhy)
{
    EXPECT_EQ(readPropertyListFromDescriptor(-1).error, "input error: Bad file descriptor");
    const FileDescriptor directory(open("/", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    EXPECT_EQ(readPropertyListFromDescriptor(directory.get()).error, "input error: Is a directory");
}

}  // namespace
}  // namespace typhon
