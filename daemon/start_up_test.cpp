#include "daemon/start_up.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {
namespace {

class RecordedSteps final : public StartUpSteps {
public:
    void setupForSluiceService() override { taken.emplace_back("setupForSluiceService"); }
    void setupForScheduledFontDeletion() override { taken.emplace_back("setupForScheduledFontDeletion"); }
    void setupForDistributedNotifications() override
    {
        taken.emplace_back("setupForDistributedNotifications");
    }
    void setupForAssetNotifications() override { taken.emplace_back("setupForAssetNotifications"); }
    void setupForMonitoringFontAssets() override { taken.emplace_back("setupForMonitoringFontAssets"); }
    void setupForProfileFonts() override { taken.emplace_back("setupForProfileFonts"); }
    void setup() override { taken.emplace_back("setup"); }

    std::vector<std::string> taken;
};

TEST(StartUp, TheStepsAreTakenOnceEachInTheirOrder)
{
    RecordedSteps steps;
    startUp(steps);
    EXPECT_EQ(steps.taken,
              (std::vector<std::string>{"setupForSluiceService", "setupForScheduledFontDeletion",
                                        "setupForDistributedNotifications", "setupForAssetNotifications",
                                        "setupForMonitoringFontAssets", "setupForProfileFonts", "setup"}));
}

}  // namespace
}  // namespace typhon
