#include "platform/font_directories.h"
#include "registry/registry_snapshot.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;

PropertyList font(std::optional<bool> disabled = std::nullopt)
{
    Dictionary entry{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}, {"added", 7}};
    if (disabled) {
        entry.emplace("disabled", *disabled);
    }
    return entry;
}

std::vector<std::string> pathsIn(const RegistrySnapshot& registry, std::string_view directory)
{
    std::vector<std::string> paths;
    for (const auto* entry : registry.entriesInDirectoryNamed(directory)) {
        paths.push_back(entry->first);
    }
    return paths;
}

TEST(FontDirectories, TheNameOfTheDirectoryThatHoldsAFile)
{
    EXPECT_EQ(font_directories::nameOfDirectoryHolding("/a/b/c.ttf"), "b");
    EXPECT_EQ(font_directories::nameOfDirectoryHolding("/c.ttf"), "");
    EXPECT_EQ(font_directories::nameOfDirectoryHolding("c.ttf"), "");
    EXPECT_EQ(font_directories::nameOfDirectoryHolding("b/c.ttf"), "b");
}

TEST(RegistrySnapshot, TheEnumerationViewHoldsEnabledEntriesWithoutTheirDisabledKey)
{
    const RegistrySnapshot registry(
        Dictionary{{"/f/X/a.ttf", font()}, {"/f/X/b.ttf", font(false)}, {"/f/X/c.ttf", font(true)}});
    EXPECT_EQ(registry.enumerationView(),
              PropertyList(Dictionary{{"/f/X/a.ttf", font()}, {"/f/X/b.ttf", font()}}));
}

TEST(RegistrySnapshot, TheEnumerationViewIsOneValueForAll)
{
    const RegistrySnapshot registry(Dictionary{{"/f/X/a.ttf", font(false)}});
    const PropertyList first = registry.enumerationView();
    const PropertyList second = registry.enumerationView();
    EXPECT_EQ(first.identity().lock(), second.identity().lock());
}

TEST(RegistrySnapshot, EntriesAreFoundByPathWithDisabledOnes)
{
    const RegistrySnapshot registry(Dictionary{{"/f/X/a.ttf", font(true)}});
    EXPECT_EQ(registry.count(), 1U);
    ASSERT_NE(registry.entry("/f/X/a.ttf"), nullptr);
    EXPECT_EQ(*registry.entry("/f/X/a.ttf"), font(true));
    EXPECT_EQ(registry.entry("/f/X/b.ttf"), nullptr);
}

TEST(RegistrySnapshot, EntriesAreFoundByTheNameOfTheirDirectoryWhereverItIs)
{
    const RegistrySnapshot registry(Dictionary{{"/f/X/a.ttf", font()},
                                               {"/f/X/b.ttf", font(true)},
                                               {"/f/Y/c.ttf", font()},
                                               {"/other/X/d.ttf", font()},
                                               {"/f/X/deeper/e.ttf", font()}});
    EXPECT_EQ(pathsIn(registry, "X"),
              (std::vector<std::string>{"/f/X/a.ttf", "/f/X/b.ttf", "/other/X/d.ttf"}));
    EXPECT_EQ(pathsIn(registry, "deeper"), (std::vector<std::string>{"/f/X/deeper/e.ttf"}));
    EXPECT_TRUE(pathsIn(registry, "Z").empty());
}

TEST(RegistrySnapshot, OnlyTheBooleanTrueDisables)
{
    EXPECT_TRUE(isDisabled(font(true)));
    EXPECT_FALSE(isDisabled(font(false)));
    EXPECT_FALSE(isDisabled(font()));
}

}  // namespace
}  // namespace typhon
