#include "tools/relayd/removal_tracker.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using std::chrono::seconds;
using Identifiers = std::vector<std::string>;

const RemovalTracker::Time start{seconds(1000)};

TEST(RemovalTracker, AnApplicationMissingForTheWholeWindowWasRemoved)
{
    RemovalTracker tracker(seconds(10));
    tracker.saw({"org.example.a", "org.example.b"}, start);
    EXPECT_EQ(tracker.saw({"org.example.b"}, start + seconds(1)), Identifiers{});
    EXPECT_EQ(tracker.nextDue(), start + seconds(11));
    EXPECT_EQ(tracker.saw({"org.example.b"}, start + seconds(10)), Identifiers{});
    EXPECT_EQ(tracker.saw({"org.example.b"}, start + seconds(11)), Identifiers{"org.example.a"});
    EXPECT_EQ(tracker.nextDue(), std::nullopt);
}

TEST(RemovalTracker, AnApplicationThatComesBackWithinTheWindowWasReplaced)
{
    RemovalTracker tracker(seconds(10));
    tracker.saw({"org.example.a"}, start);
    tracker.saw({}, start + seconds(1));
    EXPECT_EQ(tracker.saw({"org.example.a"}, start + seconds(9)), Identifiers{});
    EXPECT_EQ(tracker.nextDue(), std::nullopt);
    EXPECT_EQ(tracker.saw({"org.example.a"}, start + seconds(100)), Identifiers{});
}

TEST(RemovalTracker, TheWindowBeginsAnewWithEveryAbsence)
{
    RemovalTracker tracker(seconds(10));
    tracker.saw({"org.example.a"}, start);
    tracker.saw({}, start + seconds(1));
    tracker.saw({"org.example.a"}, start + seconds(9));
    tracker.saw({}, start + seconds(10));
    EXPECT_EQ(tracker.saw({}, start + seconds(12)), Identifiers{});
    EXPECT_EQ(tracker.saw({}, start + seconds(20)), Identifiers{"org.example.a"});
}

TEST(RemovalTracker, ARemovalIsToldOnce)
{
    RemovalTracker tracker(seconds(0));
    tracker.saw({"org.example.a"}, start);
    EXPECT_EQ(tracker.saw({}, start), Identifiers{"org.example.a"});
    EXPECT_EQ(tracker.saw({}, start + seconds(1)), Identifiers{});
}

TEST(RemovalTracker, AnApplicationInstalledAgainCanBeRemovedAgain)
{
    RemovalTracker tracker(seconds(0));
    tracker.saw({"org.example.a"}, start);
    tracker.saw({}, start);
    tracker.saw({"org.example.a"}, start + seconds(1));
    EXPECT_EQ(tracker.saw({}, start + seconds(2)), Identifiers{"org.example.a"});
}

TEST(RemovalTracker, WhatWasNeverSeenIsNotRemoved)
{
    RemovalTracker tracker(seconds(0));
    EXPECT_EQ(tracker.saw({}, start), Identifiers{});
}

}  // namespace
}  // namespace typhon
