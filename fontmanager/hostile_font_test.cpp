#include "fontmanager/font_parser.h"
#include "platform/linux/file_descriptor.h"

#include <chrono>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

// The reader of these tests does whatever the "font" says; see testing/hostile_parser.cpp.

namespace typhon {
namespace {

using testing::HasSubstr;
using testing::StartsWith;
using Names = std::map<std::string, std::string>;

std::string hostileProgram()
{
    return (std::filesystem::read_symlink("/proc/self/exe").parent_path() / "hostile-font-parser").string();
}

FileDescriptor fileWith(const std::string& contents)
{
    FileDescriptor file(::memfd_create("font", MFD_CLOEXEC));
    EXPECT_EQ(::write(file.get(), contents.data(), contents.size()), static_cast<ssize_t>(contents.size()));
    return file;
}

class HostileFontTest : public testing::Test {
protected:
    FontNamesReading read(const std::string& deed) { return parser.read(fileWith(deed).get()); }

    FontParser parser{{.time = std::chrono::seconds(1)}, hostileProgram()};
};

TEST_F(HostileFontTest, WhateverAReaderNeedNotDoEndsIt)
{
    const auto deeds = read("list");
    ASSERT_TRUE(deeds.familyNames) << deeds.error;
    EXPECT_GE(deeds.familyNames->size(), 40U);
    for (const auto& [deed, kind] : *deeds.familyNames) {
        EXPECT_EQ(read(deed).error, "crashes the font reader (Bad system call)") << deed;
    }
}

TEST_F(HostileFontTest, ACrashIsAnErrorAndTheNextFontIsRead)
{
    for (const char* deed : {"crash", "abort", "exit"}) {
        const auto reading = read(deed);
        EXPECT_EQ(reading.familyNames, std::nullopt) << deed;
        EXPECT_THAT(reading.error, StartsWith("crashes the font reader")) << deed;
        EXPECT_EQ(read("count").familyNames, (Names{{"Name", "1"}})) << deed;
    }
}

TEST_F(HostileFontTest, AFontThatHangsTheReaderIsRefusedWhenItsTimeIsUp)
{
    EXPECT_EQ(read("spin").error, "takes more than 1 s to read");
    EXPECT_EQ(read("count").familyNames, (Names{{"Name", "1"}}));
}

TEST_F(HostileFontTest, AFontThatHangsDoesNotHoldUpOthers)
{
    FontNamesReading hanging;
    std::thread other([&] { hanging = read("spin"); });
    for (int round = 0; round < 5; ++round) {
        EXPECT_EQ(read("count").familyNames, (Names{{"Name", "1"}}));
    }
    other.join();
    EXPECT_EQ(hanging.error, "takes more than 1 s to read");
}

// The sanitizers handle faults themselves, and their books do not fit into any limit of memory.
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
TEST_F(HostileFontTest, TheErrorOfACrashNamesItsSignal)
{
    EXPECT_EQ(read("crash").error, "crashes the font reader (Segmentation fault)");
}

TEST_F(HostileFontTest, AFontThatEatsMemoryIsRefused)
{
    EXPECT_EQ(read("eat").error, "takes more than 256 MiB of memory to read");
    EXPECT_EQ(read("count").familyNames, (Names{{"Name", "1"}}));
}
#endif

TEST_F(HostileFontTest, NothingOfOneReadingIsLeftForTheNext)
{
    EXPECT_EQ(read("count").familyNames, (Names{{"Name", "1"}}));
    EXPECT_EQ(read("count").familyNames, (Names{{"Name", "1"}}));
}

TEST_F(HostileFontTest, TheReaderKnowsNothingOfItsCaller)
{
    EXPECT_EQ(read("environment").familyNames, (Names{{"Name", "empty"}}));
}

TEST_F(HostileFontTest, AnAnswerThatIsNoneIsAnError)
{
    constexpr const char* nonsense = "the font reader gave an answer that makes no sense";
    EXPECT_EQ(read("answer ").error, nonsense);
    EXPECT_EQ(read("answer bplist00").error, nonsense);
    EXPECT_EQ(read("answer " + std::string(60000, 'x')).error, nonsense);
}

TEST_F(HostileFontTest, AnAnswerWithoutEndIsCutOff)
{
    EXPECT_EQ(read("talk").error, "has more names than any font");
    EXPECT_EQ(read("count").familyNames, (Names{{"Name", "1"}}));
}

TEST_F(HostileFontTest, TheFontItselfStaysAsItWas)
{
    const auto file = fileWith("truncateTheFont");
    EXPECT_EQ(parser.read(file.get()).error, "crashes the font reader (Bad system call)");
    EXPECT_EQ(::lseek(file.get(), 0, SEEK_END), 15);
}

}  // namespace
}  // namespace typhon
