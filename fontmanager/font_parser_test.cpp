#include "fontmanager/font_parser.h"
#include "fontmanager/test_fonts.h"
#include "fontmanager/test_tables.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/scratch_directory.h"

#include <atomic>
#include <csignal>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon {
namespace {

using testing::HasSubstr;
using Names = std::map<std::string, std::string>;

const Names namesOfSansBold{{"DejaVuSans-Bold", "DejaVu Sans"}};

class FontParserTest : public testing::Test {
protected:
    FontNamesReading namesIn(const std::string& path)
    {
        return parser.read(openRegularFile(path).file.get());
    }
    FontNamesReading namesOf(const std::string& contents)
    {
        scratch.writeFile("/font", contents);
        return namesIn(scratch.real("/font"));
    }
    ScratchDirectory scratch;
    FontParser parser;
};

std::vector<std::string> manyNames(std::size_t count)
{
    std::vector<std::string> names;
    for (std::size_t face = 0; face < count; ++face) {
        names.push_back("Many-" + std::to_string(face));
    }
    return names;
}

/// The processes that the calling thread's process has started and that still run.
std::vector<pid_t> childProcesses()
{
    std::vector<pid_t> children;
    for (const auto& thread : std::filesystem::directory_iterator("/proc/self/task")) {
        std::ifstream list(thread.path() / "children");
        for (pid_t child = 0; list >> child;) {
            children.push_back(child);
        }
    }
    return children;
}

TEST_F(FontParserTest, ReadsWhatTheReaderItselfReads)
{
    EXPECT_EQ(namesIn(test_fonts::sansBold).familyNames, namesOfSansBold);
    EXPECT_EQ(namesIn(test_fonts::sansBold).error, "");
    EXPECT_EQ(namesIn(test_fonts::collection).familyNames,
              (Names{{"WenQuanYiMicroHei", "WenQuanYi Micro Hei"},
                     {"WenQuanYiMicroHeiMono", "WenQuanYi Micro Hei Mono"}}));
}

TEST_F(FontParserTest, EveryFontOfTheSystemReadsAsItDoesWithoutConfinement)
{
    std::size_t fonts = 0;
    for (const auto& entry : std::filesystem::recursive_directory_iterator("/usr/share/fonts/truetype")) {
        if (entry.path().extension() == ".ttf" || entry.path().extension() == ".ttc") {
            const auto opened = openRegularFile(entry.path());
            const auto reading = parser.read(opened.file.get());
            EXPECT_TRUE(reading.familyNames) << entry.path() << ": " << reading.error;
            EXPECT_EQ(reading.familyNames, readFontNames(opened.file.get()).familyNames) << entry.path();
            ++fonts;
        }
    }
    EXPECT_GE(fonts, 20U);
}

TEST_F(FontParserTest, WhatIsNoFontIsAnError)
{
    EXPECT_EQ(namesOf("").error, "not a TrueType or OpenType font");
    EXPECT_EQ(namesOf("not a font at all").error, "not a TrueType or OpenType font");
    EXPECT_EQ(namesOf("%!PS-AdobeFont-1.0: Letters").error, "not a TrueType or OpenType font");
}

TEST_F(FontParserTest, WhatIsNoFileIsAnError)
{
    EXPECT_EQ(parser.read(-1).error, "not a file that can be read");
    EXPECT_EQ(parser.read(FileDescriptor(::open("/tmp", O_RDONLY | O_CLOEXEC)).get()).error,
              "not a regular file");
    EXPECT_EQ(parser.read(FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC)).get()).error,
              "not a regular file");
}

TEST_F(FontParserTest, AFileOf1GBIsRefusedWithoutBeingRead)
{
    scratch.writeFile("/huge", test_fonts::contentsOf(test_fonts::sansBold));
    std::filesystem::resize_file(scratch.real("/huge"), std::uintmax_t(1) << 30);
    EXPECT_EQ(namesIn(scratch.real("/huge")).error, "larger than 536870912 bytes");
    EXPECT_TRUE(childProcesses().empty());
}

TEST_F(FontParserTest, ALargeFileWithinTheLimitIsReadWithinTheLimitOfMemory)
{
    scratch.writeFile("/large", test_fonts::contentsOf(test_fonts::sansBold));
    std::filesystem::resize_file(scratch.real("/large"), std::uintmax_t(512) << 20);
    EXPECT_EQ(namesIn(scratch.real("/large")).familyNames, namesOfSansBold);
}

TEST_F(FontParserTest, ACollectionMayHave256Faces)
{
    const auto font = test_fonts::contentsOf(test_fonts::sansBold);
    const auto reading = namesOf(test_fonts::collectionWithNames(font, manyNames(256)));
    ASSERT_TRUE(reading.familyNames) << reading.error;
    EXPECT_EQ(reading.familyNames->size(), 256U);
    EXPECT_EQ(reading.familyNames->at("Many-255"), "Many");
}

TEST_F(FontParserTest, ACollectionWith1000FacesIsRefused)
{
    const auto font = test_fonts::contentsOf(test_fonts::sansBold);
    EXPECT_EQ(namesOf(test_fonts::collectionWithNames(font, manyNames(1000))).error,
              "the font has 1000 faces; 1 to 256 are accepted");
}

TEST_F(FontParserTest, TheSamePostScriptNameTwiceInAFileIsAnError)
{
    const auto font = test_fonts::contentsOf(test_fonts::sansBold);
    EXPECT_EQ(namesOf(test_fonts::collectionWithNames(font, {"One", "Two", "One"})).error,
              "two faces of the font have the PostScript name One");
}

TEST_F(FontParserTest, AFontWithoutNamesIsAnError)
{
    auto tables = test_fonts::tablesOf(test_fonts::contentsOf(test_fonts::sansBold));
    tables["name"] = test_fonts::nameTable("", "");
    EXPECT_THAT(namesOf(test_fonts::fontOf(tables)).error, HasSubstr("no usable"));
    tables["name"] = test_fonts::nameTable("Letters", "");
    EXPECT_EQ(namesOf(test_fonts::fontOf(tables)).error, "face 0 has no usable family name");
    tables["name"] = test_fonts::nameTable("Letters", "Let\ners");
    EXPECT_EQ(namesOf(test_fonts::fontOf(tables)).error, "face 0 has no usable family name");
    tables.erase("name");
    EXPECT_NE(namesOf(test_fonts::fontOf(tables)).error, "");
}

TEST_F(FontParserTest, AFontWithoutATableThatItNeedsIsAnError)
{
    const auto whole = test_fonts::tablesOf(test_fonts::contentsOf(test_fonts::sansBold));
    EXPECT_EQ(namesOf(test_fonts::fontOf(whole)).familyNames, namesOfSansBold);
    for (const char* tag : {"head", "hhea", "hmtx", "loca"}) {
        auto tables = whole;
        tables.erase(tag);
        EXPECT_THAT(namesOf(test_fonts::fontOf(tables)).error, HasSubstr("cannot be read")) << tag;
    }
}

TEST_F(FontParserTest, ADescriptorThatAllowsWritingIsHandedOnForReading)
{
    scratch.writeFile("/font", test_fonts::contentsOf(test_fonts::sansBold));
    const FileDescriptor file(::open(scratch.real("/font").c_str(), O_RDWR | O_CLOEXEC));
    ASSERT_EQ(::lseek(file.get(), 1234, SEEK_SET), 1234);
    ASSERT_EQ(::unlink(scratch.real("/font").c_str()), 0);
    EXPECT_EQ(parser.read(file.get()).familyNames, namesOfSansBold);
    EXPECT_EQ(::lseek(file.get(), 0, SEEK_CUR), 1234);
}

TEST_F(FontParserTest, AReadingProcessThatWasKilledIsStartedAnew)
{
    EXPECT_TRUE(childProcesses().empty());
    EXPECT_EQ(namesIn(test_fonts::sansBold).familyNames, namesOfSansBold);
    const auto children = childProcesses();
    ASSERT_EQ(children.size(), 1U);
    ASSERT_EQ(::kill(children.front(), SIGKILL), 0);
    // Until it has ended; it stays to be waited for by its owner.
    siginfo_t ended{};
    ASSERT_EQ(::waitid(P_PID, static_cast<id_t>(children.front()), &ended, WEXITED | WNOWAIT), 0);
    EXPECT_EQ(namesIn(test_fonts::sansBold).familyNames, namesOfSansBold);
    EXPECT_NE(childProcesses(), children);
}

TEST_F(FontParserTest, NothingIsLeftBehind)
{
    {
        FontParser another;
        EXPECT_TRUE(another.read(openRegularFile(test_fonts::sansBold).file.get()).familyNames);
        EXPECT_EQ(childProcesses().size(), 1U);
    }
    EXPECT_TRUE(childProcesses().empty());
}

TEST_F(FontParserTest, ManyThreadsReadAtOnce)
{
    std::atomic<int> right = 0;
    std::vector<std::thread> threads;
    for (int index = 0; index < 8; ++index) {
        threads.emplace_back([&] {
            for (int round = 0; round < 20; ++round) {
                right += namesIn(test_fonts::sansBold).familyNames == namesOfSansBold ? 1 : 0;
            }
        });
    }
    for (auto& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(right, 160);
    EXPECT_LE(childProcesses().size(), FontParserLimits{}.processes);
}

TEST_F(FontParserTest, AProgramThatCannotBeStartedIsNamed)
{
    FontParser missing({}, "/nonexistent/parser");
    EXPECT_EQ(missing.read(openRegularFile(test_fonts::sans).file.get()).error,
              "cannot start the font reader /nonexistent/parser: No such file or directory");
    FontParser another({}, "/bin/true");
    EXPECT_EQ(another.read(openRegularFile(test_fonts::sans).file.get()).error,
              "the font reader does not start");
}

}  // namespace
}  // namespace typhon
