#include "tools/analytics_counts.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

std::string entry(const char* boot, const char* event, const char* name, int misses)
{
    return std::string("_BOOT_ID=") + boot + "\nMESSAGE=m\nTYPHON_EVENT=" + event +
           "\nTYPHON_EVENT_MISSES=" + std::to_string(misses) + "\nTYPHON_EVENT_NAME=" + name +
           "\nTYPHON_EVENT_RESOLVED=1\nTYPHON_EVENT_SUGGESTIONS=2\n\n";
}

TEST(AnalyticsCounts, AddUpTheRequestsOfThisBootByApplication)
{
    constexpr const char* event = "com.vorlan.font-privacy";
    const auto counts = countsInExport(entry("now", event, "a", 3) + entry("before", event, "a", 100) +
                                           entry("now", "another", "a", 100) + entry("now", event, "a", 4) +
                                           entry("now", event, "b", 0),
                                       "now");
    ASSERT_EQ(counts.size(), 2U);
    EXPECT_EQ(counts.at("a").requests, 2);
    EXPECT_EQ(counts.at("a").misses, 7);
    EXPECT_EQ(counts.at("a").suggestions, 4);
    EXPECT_EQ(counts.at("a").resolved, 2);
    EXPECT_EQ(counts.at("b").requests, 1);
}

TEST(AnalyticsCounts, OfDamagedTextAreThoseOfItsWholeEntries)
{
    EXPECT_TRUE(countsInExport("", "now").empty());
    EXPECT_TRUE(countsInExport("\n\nnonsense\n=\n\nTYPHON_EVENT=", "now").empty());
}

}  // namespace
}  // namespace typhon
