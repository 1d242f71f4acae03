// A change that ended in its middle, at each of the points where that makes a difference, and the next run.

#include "fontmanager/font_store_fixture.h"

#include <gmock/gmock.h>

namespace typhon {
namespace {

using namespace test_store;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class InterruptedChangeTest : public testing::Test {
protected:
    void SetUp() override { scratch.writeFile(directory + "/old.ttf", "font Old"); }

    StagedFont staged(int number, const std::string& name)
    {
        StagedFont font{.temporary = ".installing-1-" + std::to_string(number),
                        .font = {.path = directory + "/" + name, .familyNames = {{"New", "Family"}}}};
        scratch.writeFile(directory + "/" + font.temporary, "font New");
        return font;
    }
    void registerOld()
    {
        ASSERT_EQ(RegistryWriter(root).add({{.path = directory + "/old.ttf", .familyNames = {{"Old", "F"}}}}),
                  std::nullopt);
    }
    RegistryChangeOutcome nextRun()
    {
        FontStore store(root, readText, log);
        auto outcome = store.open();
        store.changeWasReported();
        return outcome;
    }
    PropertyList registry() const
    {
        auto reading = LinuxFileSystem(root).readPropertyList(font_paths::registry);
        return reading.value ? *reading.value : PropertyList();
    }
    std::vector<std::string> names() const
    {
        std::vector<std::string> found;
        for (const auto& entry : std::filesystem::directory_iterator(root.real(directory))) {
            found.push_back(entry.path().filename());
        }
        std::ranges::sort(found);
        return found;
    }

    ScratchDirectory scratch;
    KeptLog log;
    RootDirectory root{scratch.path()};
};

TEST_F(InterruptedChangeTest, CopiesThatNobodyDecidedOnAreSwept)
{
    staged(0, "x.ttf");
    EXPECT_FALSE(nextRun().change.isRegistryChanged);
    EXPECT_THAT(names(), ElementsAre("old.ttf"));
    EXPECT_EQ(registry(), PropertyList());
}

TEST_F(InterruptedChangeTest, ARegistryOfWhichNobodyHeardIsReportedByTheNextRunAndOnlyByThat)
{
    registerOld();
    const auto change = nextRun().change;
    EXPECT_TRUE(change.isRegistryChanged);
    EXPECT_THAT(change.available, IsEmpty());
    EXPECT_FALSE(nextRun().change.isRegistryChanged);
    EXPECT_FALSE(std::filesystem::exists(root.real(font_paths::unreported)));
}

TEST_F(InterruptedChangeTest, ADirectoryWithNothingButCopiesGoesWithThem)
{
    std::filesystem::remove(root.real(directory + "/old.ttf"));
    staged(0, "x.ttf");
    nextRun();
    EXPECT_FALSE(std::filesystem::exists(root.real(directory)));
}

TEST_F(InterruptedChangeTest, FilesThatOnlyLookLikeOursAreLeft)
{
    for (const char* name : {".installed-1", "installing-1", ".hidden", "x.ttf"}) {
        scratch.writeFile(directory + "/" + name, "somebody else's");
    }
    nextRun();
    EXPECT_EQ(names().size(), 5u);
}

TEST_F(InterruptedChangeTest, ADecidedRegistrationIsCompleted)
{
    registerOld();
    ASSERT_EQ(
        ChangeJournal(root).write({.placements = {staged(0, "x.ttf"), staged(1, "old.ttf")}, .removals = {}}),
        std::nullopt);
    const auto outcome = nextRun();
    EXPECT_EQ(outcome.error, std::nullopt);
    EXPECT_THAT(outcome.change.available, ElementsAre(directory + "/x.ttf", directory + "/old.ttf"));
    EXPECT_THAT(names(), ElementsAre("old.ttf", "x.ttf"));
    EXPECT_EQ(scratch.readFile(directory + "/old.ttf"), "font New");
    EXPECT_NE(registry().find(directory + "/old.ttf")->find("familyName")->find("New"), nullptr);
    EXPECT_NE(registry().find(directory + "/x.ttf"), nullptr);
    EXPECT_FALSE(nextRun().change.isRegistryChanged);
}

TEST_F(InterruptedChangeTest, OneThatHadBegunToMoveFilesToo)
{
    ASSERT_EQ(
        ChangeJournal(root).write({.placements = {staged(0, "x.ttf"), staged(1, "y.ttf")}, .removals = {}}),
        std::nullopt);
    std::filesystem::rename(root.real(directory + "/.installing-1-0"), root.real(directory + "/x.ttf"));
    EXPECT_EQ(nextRun().change.available.size(), 2u);
    EXPECT_THAT(names(), ElementsAre("old.ttf", "x.ttf", "y.ttf"));
    EXPECT_EQ(registry().asDictionary()->size(), 2u);
}

TEST_F(InterruptedChangeTest, AFileThatWasLostIsNotRegistered)
{
    ASSERT_EQ(
        ChangeJournal(root).write({.placements = {staged(0, "x.ttf"), staged(1, "y.ttf")}, .removals = {}}),
        std::nullopt);
    std::filesystem::remove(root.real(directory + "/.installing-1-0"));
    EXPECT_THAT(nextRun().change.available, ElementsAre(directory + "/y.ttf"));
    EXPECT_EQ(registry().find(directory + "/x.ttf"), nullptr);
    EXPECT_TRUE(log.has("was lost before it was registered"));
}

TEST_F(InterruptedChangeTest, ADecidedRemovalIsCompleted)
{
    registerOld();
    ASSERT_EQ(ChangeJournal(root).write({.placements = {}, .removals = {directory + "/old.ttf"}}),
              std::nullopt);
    EXPECT_THAT(nextRun().change.gone, ElementsAre(directory + "/old.ttf"));
    EXPECT_EQ(registry(), PropertyList());
    EXPECT_FALSE(std::filesystem::exists(root.real(directory)));
}

TEST_F(InterruptedChangeTest, OneWhoseRegistryWasReplacedAlreadyRemovesTheFileAndIsReported)
{
    ASSERT_EQ(ChangeJournal(root).write({.placements = {}, .removals = {directory + "/old.ttf"}}),
              std::nullopt);
    EXPECT_THAT(nextRun().change.gone, ElementsAre(directory + "/old.ttf"));
    EXPECT_FALSE(std::filesystem::exists(root.real(directory)));
}

TEST_F(InterruptedChangeTest, OneThatWasNotReportedIsGivenToTheNextRunToo)
{
    registerOld();
    {
        FontStore killed(root, readText, log);
        killed.open();
        EXPECT_THAT(killed.unregister({directory + "/old.ttf"}).change.gone,
                    ElementsAre(directory + "/old.ttf"));
    }
    EXPECT_THAT(nextRun().change.gone, ElementsAre(directory + "/old.ttf"));
    EXPECT_FALSE(nextRun().change.isRegistryChanged);
}

TEST_F(InterruptedChangeTest, OneThatWasReportedIsNot)
{
    registerOld();
    {
        FontStore store(root, readText, log);
        store.open();
        store.unregister({directory + "/old.ttf"});
        store.changeWasReported();
    }
    EXPECT_FALSE(nextRun().change.isRegistryChanged);
}

TEST_F(InterruptedChangeTest, TheReportOfAnotherChangeBesideItIsNotTakenForItsOwn)
{
    registerOld();
    {
        FontStore killed(root, readText, log);
        killed.open();
        killed.changeWasReported();
        killed.changeBegins();
        killed.changeBegins();
        killed.unregister({directory + "/old.ttf"});
        killed.changeWasReported();
    }
    const auto change = nextRun().change;
    EXPECT_TRUE(change.isRegistryChanged);
    EXPECT_THAT(change.gone, ElementsAre(directory + "/old.ttf"));
}

TEST_F(InterruptedChangeTest, OneThatWasNotReportedIsNotDoneAgainOverALaterChange)
{
    {
        FontStore store(root, readText, log);
        store.open();
        auto begun = store.begin("org.example.a", true);
        ASSERT_EQ(begun.registration->add("x.ttf", fileWith("font X").get()), std::nullopt);
        ASSERT_EQ(store.commit(*begun.registration).error, std::nullopt);
        ASSERT_EQ(store.setEnabled({directory + "/x.ttf"}, false).error, std::nullopt);
    }
    const auto change = nextRun().change;
    EXPECT_THAT(change.available, IsEmpty());
    EXPECT_THAT(change.gone, IsEmpty());
    EXPECT_TRUE(registry().find(directory + "/x.ttf")->find("disabled")->isTrue());
}

TEST_F(InterruptedChangeTest, WhatTheNextOperationCompletesItTellsEvenIfItFailsItself)
{
    FontStore store(root, readText, log);
    ASSERT_EQ(store.open().error, std::nullopt);
    ASSERT_EQ(ChangeJournal(root).write({.placements = {staged(0, "x.ttf")}, .removals = {}}), std::nullopt);
    const auto outcome = store.setEnabled({directory + "/unknown.ttf"}, true);
    EXPECT_TRUE(outcome.error);
    EXPECT_THAT(outcome.change.available, ElementsAre(directory + "/x.ttf"));
    EXPECT_NE(registry().find(directory + "/x.ttf"), nullptr);
    EXPECT_THAT(store.unregister({directory + "/x.ttf"}).change.available, IsEmpty());
}

TEST_F(InterruptedChangeTest, AJournalThatIsNotOursStopsEverythingAndIsLeft)
{
    for (const std::string contents : {"no property list", "<plist version=\"1.0\"><dict/></plist>"}) {
        scratch.writeFile(font_paths::journal, contents);
        EXPECT_TRUE(nextRun().error);
        EXPECT_EQ(scratch.readFile(font_paths::journal), contents);
    }
}

TEST_F(InterruptedChangeTest, AJournalCannotNameFilesElsewhere)
{
    StagedFont outside = staged(0, "x.ttf");
    outside.font.path = "/etc/passwd";
    ASSERT_EQ(ChangeJournal(root).write({.placements = {outside}, .removals = {}}), std::nullopt);
    EXPECT_TRUE(nextRun().error);
    StagedFont climbing = staged(0, "x.ttf");
    climbing.temporary = ".installing-/../../../secret";
    ASSERT_EQ(ChangeJournal(root).write({.placements = {climbing}, .removals = {}}), std::nullopt);
    EXPECT_TRUE(nextRun().error);
}

TEST_F(InterruptedChangeTest, ARegistryThatWasNotWrittenToItsEndIsSwept)
{
    scratch.writeFile(std::string(font_paths::registry) + ".new", "half");
    nextRun();
    EXPECT_FALSE(std::filesystem::exists(root.real(font_paths::registry) + ".new"));
}

}  // namespace
}  // namespace typhon
