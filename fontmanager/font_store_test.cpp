#include "fontmanager/font_store_fixture.h"

#include <thread>

#include <gmock/gmock.h>
#include <sys/stat.h>

namespace typhon {
namespace {

using namespace test_store;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class FontStoreTest : public FontStoreFixture {};

TEST_F(FontStoreTest, ARegistrationPutsItsFilesAndEntriesInPlaceTogether)
{
    const auto outcome = install("org.example.a", {"x.ttf", "y.ttf"});
    EXPECT_EQ(outcome.error, std::nullopt);
    EXPECT_THAT(outcome.change.available, ElementsAre(directory + "/x.ttf", directory + "/y.ttf"));
    EXPECT_THAT(outcome.change.gone, IsEmpty());
    EXPECT_THAT(files(), ElementsAre(directory + "/x.ttf", directory + "/y.ttf"));
    EXPECT_EQ(scratch.readFile(directory + "/x.ttf"), "font X");
    EXPECT_EQ(registry().asDictionary()->size(), 2u);
    EXPECT_EQ(*registry().find(directory + "/x.ttf"),
              PropertyList(PropertyList::Dictionary{{"familyName", PropertyList::Dictionary{{"X", "Family"}}},
                                                    {"disabled", false}}));
    struct stat status {};
    ASSERT_EQ(::stat(root.real(directory + "/x.ttf").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0644u);
}

TEST_F(FontStoreTest, OneBadFileKeepsAllOut)
{
    auto begun = store.begin("org.example.a", true);
    EXPECT_EQ(begun.registration->add("x.ttf", fileWith("font X").get()), std::nullopt);
    EXPECT_EQ(begun.registration->add("bad.ttf", fileWith("nothing").get()), std::nullopt);
    EXPECT_EQ(store.commit(*begun.registration).error, "bad.ttf: not a font");
    begun.registration.reset();
    EXPECT_THAT(files(), IsEmpty());
    EXPECT_EQ(registry(), PropertyList());
}

TEST_F(FontStoreTest, AFileOfTheSameNameIsReplacedWithItsEntry)
{
    install("org.example.a", {"x.ttf"}, "font Old", false);
    const auto outcome = install("org.example.a", {"x.ttf"}, "font New");
    EXPECT_THAT(outcome.change.available, ElementsAre(directory + "/x.ttf"));
    EXPECT_EQ(scratch.readFile(directory + "/x.ttf"), "font New");
    EXPECT_NE(registry().find(directory + "/x.ttf")->find("familyName")->find("New"), nullptr);
    EXPECT_EQ(registry().asDictionary()->size(), 1u);
}

TEST_F(FontStoreTest, ADisabledFontIsAvailableToNobody)
{
    const auto fresh = install("org.example.a", {"x.ttf"}, "font X", false);
    EXPECT_THAT(fresh.change.available, IsEmpty());
    EXPECT_THAT(fresh.change.gone, IsEmpty());
    EXPECT_TRUE(fresh.change.isRegistryChanged);
    install("org.example.a", {"y.ttf"});
    const auto replaced = install("org.example.a", {"y.ttf"}, "font X", false);
    EXPECT_THAT(replaced.change.gone, ElementsAre(directory + "/y.ttf"));
}

TEST_F(FontStoreTest, SwitchingTellsOnlyWhatIsOtherThanBefore)
{
    install("org.example.a", {"x.ttf", "y.ttf"});
    const std::vector<std::string> both{directory + "/x.ttf", directory + "/y.ttf"};
    EXPECT_THAT(store.setEnabled({both[0]}, false).change.gone, ElementsAre(both[0]));
    EXPECT_THAT(store.setEnabled(both, false).change.gone, ElementsAre(both[1]));
    EXPECT_FALSE(store.setEnabled(both, false).change.isRegistryChanged);
    EXPECT_THAT(store.setEnabled(both, true).change.available, ElementsAre(both[0], both[1]));
}

TEST_F(FontStoreTest, SwitchingIsAllOrNone)
{
    install("org.example.a", {"x.ttf"});
    const auto before = registry();
    EXPECT_THAT(store.setEnabled({directory + "/x.ttf", directory + "/z.ttf"}, false).error.value_or(""),
                HasSubstr("z.ttf is not registered"));
    EXPECT_EQ(registry(), before);
}

TEST_F(FontStoreTest, UnregisteringRemovesEntryFileAndTheEmptyDirectory)
{
    install("org.example.a", {"x.ttf", "y.ttf"});
    EXPECT_THAT(store.unregister({directory + "/x.ttf"}).change.gone, ElementsAre(directory + "/x.ttf"));
    EXPECT_THAT(files(), ElementsAre(directory + "/y.ttf"));
    store.unregister({directory + "/y.ttf"});
    EXPECT_THAT(files(), IsEmpty());
    EXPECT_EQ(registry(), PropertyList());
    EXPECT_TRUE(isThere(font_paths::journal));
    store.changeWasReported();
    EXPECT_FALSE(isThere(font_paths::journal));
}

TEST_F(FontStoreTest, UnregisteringIsAllOrNone)
{
    install("org.example.a", {"x.ttf"});
    for (const auto& stranger :
         {directory + "/z.ttf", std::string("/etc/passwd"), directory + "/../b/x.ttf"}) {
        EXPECT_TRUE(store.unregister({directory + "/x.ttf", stranger}).error);
    }
    EXPECT_THAT(files(), ElementsAre(directory + "/x.ttf"));
    EXPECT_EQ(registry().asDictionary()->size(), 1u);
}

TEST_F(FontStoreTest, UnregisteringAProviderLeavesTheOthers)
{
    install("org.example.a", {"x.ttf"});
    install("org.example.ab", {"x.ttf"});
    EXPECT_EQ(store.unregisterAll("org.example.a").change.gone.size(), 1u);
    EXPECT_THAT(files(), ElementsAre(std::string(font_paths::fontFiles) + "org.example.ab/x.ttf"));
    EXPECT_EQ(store.unregisterAll("org.example.a").error, std::nullopt);
    EXPECT_EQ(store.unregisterAll("").error, std::nullopt);
}

TEST_F(FontStoreTest, UnregisteringLeavesFilesThatNobodyRegistered)
{
    install("org.example.a", {"x.ttf"});
    scratch.writeFile(directory + "/stranger", "somebody else's");
    store.unregisterAll("org.example.a");
    EXPECT_THAT(files(), ElementsAre(directory + "/stranger"));
}

TEST_F(FontStoreTest, SynchronizingForgetsFilesThatAreGoneAndEmptyDirectories)
{
    install("org.example.a", {"x.ttf", "y.ttf"});
    std::filesystem::remove(root.real(directory + "/x.ttf"));
    std::filesystem::create_directory(root.real(std::string(font_paths::fontFiles) + "org.example.empty"));
    EXPECT_THAT(store.synchronizeProviders().change.gone, ElementsAre(directory + "/x.ttf"));
    EXPECT_THAT(files(), ElementsAre(directory + "/y.ttf"));
    EXPECT_EQ(registry().asDictionary()->size(), 1u);
    EXPECT_FALSE(store.synchronizeProviders().change.isRegistryChanged);
}

TEST_F(FontStoreTest, NoSymbolicLinkIsFollowed)
{
    scratch.writeFile("/elsewhere/x.ttf", "font Elsewhere");
    std::filesystem::create_directory_symlink(scratch.real("/elsewhere"), root.real(directory));
    EXPECT_TRUE(install("org.example.a", {"y.ttf"}).error);
    std::filesystem::remove(root.real(directory));
    install("org.example.a", {"x.ttf"});
    std::filesystem::remove(root.real(directory + "/x.ttf"));
    std::filesystem::create_symlink(scratch.real("/elsewhere/x.ttf"), root.real(directory + "/x.ttf"));
    EXPECT_EQ(install("org.example.a", {"x.ttf"}, "font New").error, std::nullopt);
    EXPECT_EQ(scratch.readFile("/elsewhere/x.ttf"), "font Elsewhere");
    EXPECT_EQ(scratch.readFile(directory + "/x.ttf"), "font New");
    EXPECT_THAT(
        std::filesystem::directory_iterator(scratch.real("/elsewhere")),
        ::testing::Truly([](auto entries) { return std::distance(begin(entries), end(entries)) == 1; }));
}

TEST_F(FontStoreTest, ADirectoryInTheWayIsAnErrorAndChangesNothing)
{
    install("org.example.a", {"x.ttf"});
    std::filesystem::create_directory(root.real(directory + "/y.ttf"));
    EXPECT_THAT(install("org.example.a", {"x.ttf", "y.ttf"}, "font New").error.value_or(""),
                HasSubstr("y.ttf: a directory is in its place"));
    EXPECT_EQ(scratch.readFile(directory + "/x.ttf"), "font X");
    EXPECT_FALSE(isThere(font_paths::journal));
}

TEST_F(FontStoreTest, AMalformedRegistryIsNotTouchedAndNothingIsInstalled)
{
    scratch.writeFile(font_paths::registry, "broken");
    EXPECT_THAT(install("org.example.a", {"x.ttf"}).error.value_or(""), HasSubstr("is malformed"));
    EXPECT_EQ(scratch.readFile(font_paths::registry), "broken");
    EXPECT_THAT(files(), IsEmpty());
}

TEST_F(FontStoreTest, ConcurrentRegistrationsNeverLoseEachOthersEntries)
{
    std::vector<std::thread> threads;
    threads.reserve(4);
    for (int thread = 0; thread < 4; ++thread) {
        threads.emplace_back([this, thread] {
            for (int n = 0; n < 10; ++n) {
                // Two threads share each directory, which comes and goes meanwhile.
                const auto identifier = "org.example." + std::to_string(thread % 2);
                const auto name = std::to_string(thread) + "-" + std::to_string(n) + ".ttf";
                EXPECT_EQ(install(identifier, {name}).error, std::nullopt);
                if (n % 2 == 0) {
                    const auto path = font_paths::fontFiles + identifier + "/" + name;
                    EXPECT_EQ(store.unregister({path}).error, std::nullopt);
                }
            }
        });
    }
    for (auto& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(registry().asDictionary()->size(), 20u);
    EXPECT_EQ(files().size(), 20u);
}

TEST_F(FontStoreTest, OnlyOneProcessHasTheStoreOpen)
{
    FontStore second(root, readText, log);
    EXPECT_THAT(second.open().error.value_or(""), HasSubstr("another process"));
}

}  // namespace
}  // namespace typhon
