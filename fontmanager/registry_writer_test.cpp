#include "fontmanager/registry_writer.h"
#include "platform/linux/linux_file_system.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/scratch_directory.h"

#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon {
namespace {

using testing::HasSubstr;

constexpr const char* registry = "/var/mobile/Library/UserFonts/UserFonts.plist";
const std::string files = "/var/mobile/Library/UserFonts/FontFiles/";

class RegistryWriterTest : public testing::Test {
protected:
    std::optional<PropertyList> stored() const
    {
        return LinuxFileSystem(RootDirectory(scratch.path())).readPropertyList(registry).value;
    }
    ScratchDirectory scratch;
    RegistryWriter writer{RootDirectory(scratch.path())};
};

TEST_F(RegistryWriterTest, AddsEntriesAsReadersExpectThem)
{
    EXPECT_EQ(writer.add({{.path = files + "a/x.ttf", .familyNames = {{"X-Bold", "X"}}, .disabled = true},
                          {.path = files + "a/y.ttf", .familyNames = {{"Y", "Y"}}, .disabled = false}}),
              std::nullopt);
    const PropertyList expected(PropertyList::Dictionary{
        {files + "a/x.ttf",
         PropertyList::Dictionary{{"familyName", PropertyList::Dictionary{{"X-Bold", "X"}}},
                                  {"disabled", true}}},
        {files + "a/y.ttf", PropertyList::Dictionary{{"familyName", PropertyList::Dictionary{{"Y", "Y"}}},
                                                     {"disabled", false}}}});
    EXPECT_EQ(stored(), expected);
}

TEST_F(RegistryWriterTest, WritesForItsOwnerOnlyInTheFormAskedFor)
{
    ASSERT_EQ(writer.add({{.path = files + "a/x.ttf", .familyNames = {{"X", "X"}}}}), std::nullopt);
    EXPECT_TRUE(scratch.readFile(registry).starts_with("bplist00"));
    struct stat status {};
    ASSERT_EQ(::stat(scratch.real(registry).c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0600u);
    RegistryWriter xml(RootDirectory(scratch.path()), RegistryWriter::Format::xml);
    ASSERT_EQ(xml.setDisabled({files + "a/x.ttf"}, true), std::nullopt);
    EXPECT_TRUE(scratch.readFile(registry).starts_with("<?xml"));
    EXPECT_TRUE(stored()->find(files + "a/x.ttf")->find("disabled")->isTrue());
}

TEST_F(RegistryWriterTest, CarriesOverWhatItDoesNotKnow)
{
    const auto text = writeXmlPropertyList(PropertyList::Dictionary{
        {files + "a/x.ttf", PropertyList::Dictionary{{"colour", "blue"}, {"familyName", 7}}}, {"odd", 5}});
    scratch.writeFile(registry, text);
    ASSERT_EQ(writer.add({{.path = files + "a/x.ttf", .familyNames = {{"X", "X"}}}}), std::nullopt);
    const PropertyList expected(PropertyList::Dictionary{
        {files + "a/x.ttf", PropertyList::Dictionary{{"colour", "blue"},
                                                     {"familyName", PropertyList::Dictionary{{"X", "X"}}},
                                                     {"disabled", false}}},
        {"odd", 5}});
    EXPECT_EQ(stored(), expected);
}

TEST_F(RegistryWriterTest, SwitchesAndRemoves)
{
    ASSERT_EQ(writer.add({{.path = files + "a/x.ttf", .familyNames = {{"X", "X"}}}}), std::nullopt);
    ASSERT_EQ(writer.setDisabled({files + "a/x.ttf"}, true), std::nullopt);
    EXPECT_TRUE(stored()->find(files + "a/x.ttf")->find("disabled")->isTrue());
    EXPECT_NE(stored()->find(files + "a/x.ttf")->find("familyName"), nullptr);
    ASSERT_EQ(writer.remove({files + "a/x.ttf", files + "never there"}), std::nullopt);
    EXPECT_EQ(stored(), PropertyList());
}

TEST_F(RegistryWriterTest, AChangeThatFailsChangesNothing)
{
    ASSERT_EQ(writer.add({{.path = files + "a/x.ttf", .familyNames = {{"X", "X"}}}}), std::nullopt);
    const auto before = scratch.readFile(registry);
    EXPECT_THAT(writer.setDisabled({files + "a/x.ttf", files + "a/z.ttf"}, true).value_or(""),
                HasSubstr("no such font in the registry"));
    EXPECT_TRUE(writer.add(
        {{.path = files + "a/y.ttf", .familyNames = {}}, {.path = "relative", .familyNames = {}}}));
    EXPECT_TRUE(writer.add({{.path = "/not \xFF text", .familyNames = {}}}));
    EXPECT_EQ(scratch.readFile(registry), before);
}

TEST_F(RegistryWriterTest, AChangeThatChangesNothingIsNotWritten)
{
    ASSERT_EQ(writer.add({{.path = files + "a/x.ttf", .familyNames = {{"X", "X"}}}}), std::nullopt);
    RegistryWriter xml(RootDirectory(scratch.path()), RegistryWriter::Format::xml);
    ASSERT_EQ(xml.setDisabled({files + "a/x.ttf"}, false), std::nullopt);
    EXPECT_TRUE(scratch.readFile(registry).starts_with("bplist00"));
}

TEST_F(RegistryWriterTest, AStepBeforeReplacingThatFailsLeavesTheOldRegistry)
{
    ASSERT_EQ(writer.add({{.path = files + "a/x.ttf", .familyNames = {{"X", "X"}}}}), std::nullopt);
    const auto before = scratch.readFile(registry);
    const auto clear = [](PropertyList::Dictionary& entries) {
        entries.clear();
        return std::optional<std::string>();
    };
    std::string prepared;
    const auto outcome = writer.update(clear, [&]() -> std::optional<std::string> {
        prepared = scratch.readFile(std::string(registry) + ".new");
        return "no";
    });
    EXPECT_EQ(outcome, "no");
    EXPECT_TRUE(prepared.starts_with("bplist00"));
    EXPECT_EQ(scratch.readFile(registry), before);
}

TEST_F(RegistryWriterTest, AMalformedRegistryIsLeftForSomebodyToLookAt)
{
    for (const std::string contents : {"bplist00 and nothing", "<plist version=\"1.0\"><array/></plist>"}) {
        scratch.writeFile(registry, contents);
        EXPECT_THAT(writer.add({{.path = files + "a/x.ttf", .familyNames = {{"X", "X"}}}}).value_or(""),
                    HasSubstr("is malformed"));
        EXPECT_EQ(scratch.readFile(registry), contents);
    }
}

TEST_F(RegistryWriterTest, ConcurrentProcessesNeverLoseEachOthersFonts)
{
    std::vector<pid_t> children;
    for (int process = 0; process < 3; ++process) {
        children.push_back(::fork());
        if (children.back() == 0) {
            bool good = true;
            for (int n = 0; n < 15; ++n) {
                const auto path = files + std::to_string(process) + "/" + std::to_string(n);
                good = !writer.add({{.path = path, .familyNames = {{"X", "X"}}}}) && good;
            }
            ::_exit(good ? 0 : 1);
        }
    }
    for (const pid_t child : children) {
        int status = 0;
        ::waitpid(child, &status, 0);
        EXPECT_EQ(status, 0);
    }
    EXPECT_EQ(stored()->asDictionary()->size(), 45u);
}

}  // namespace
}  // namespace typhon
