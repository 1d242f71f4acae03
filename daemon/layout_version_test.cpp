#include "daemon/layout_version.h"
#include "platform/simulated/simulated_preferences.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

class LayoutVersionTest : public testing::Test {
protected:
    /// Runs the migration on a device with that "version"; returns the number of purges.
    int purgesAtVersion(std::optional<PropertyList> version)
    {
        preferences.changeFromOutside("version", std::move(version));
        int purges = 0;
        migrateLayout(preferences, [&] { ++purges; });
        return purges;
    }
    std::optional<PropertyList> storedVersion() const { return preferences.durableValue("version"); }

    SimulatedPreferences preferences;
};

TEST_F(LayoutVersionTest, AnOldLayoutIsPurgedExactlyOnceAndLeftAtVersionThree)
{
    EXPECT_EQ(purgesAtVersion(2), 1);
    EXPECT_EQ(storedVersion(), PropertyList(3));
    int purges = 0;
    migrateLayout(preferences, [&] { ++purges; });
    EXPECT_EQ(purges, 0);
    EXPECT_EQ(preferences.writes(), 1U);
    EXPECT_EQ(preferences.synchronizes(), 1U);
}

TEST_F(LayoutVersionTest, TheCurrentAndNewerLayoutsAreLeftAlone)
{
    EXPECT_EQ(purgesAtVersion(3), 0);
    EXPECT_EQ(purgesAtVersion(7), 0);
    EXPECT_EQ(storedVersion(), PropertyList(7));
    EXPECT_EQ(preferences.writes(), 0U);
    EXPECT_EQ(preferences.synchronizes(), 0U);
}

TEST_F(LayoutVersionTest, AMissingVersionAndOneThatIsNoIntegerCountAsZero)
{
    EXPECT_EQ(purgesAtVersion(std::nullopt), 1);
    EXPECT_EQ(purgesAtVersion("7"), 1);
    EXPECT_EQ(storedVersion(), PropertyList(3));
}

TEST_F(LayoutVersionTest, ThePurgeComesBeforeTheNewVersionIsStored)
{
    std::optional<PropertyList> seen;
    preferences.changeFromOutside("version", PropertyList(1));
    migrateLayout(preferences, [&] { seen = preferences.value("version"); });
    EXPECT_EQ(seen, PropertyList(1));
}

}  // namespace
}  // namespace typhon
