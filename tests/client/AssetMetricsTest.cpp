#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;

class InstalledAssetMetrics : public AppsClientFixture {
  protected:
    void add(const std::string& identifier, std::string_view type, std::uint64_t bytes) {
        AppProxy proxy;
        proxy.applicationIdentifier = identifier;
        proxy.applicationType = type;
        proxy.state.installed = true;
        proxy.staticDiskUsage = bytes;
        platform_.registry.add(proxy);
    }
};

TEST_F(InstalledAssetMetrics, CountUserApplications) {
    add(kA, "User", 1000);
    add(kB, "System", 50);
    add(kC, "User", 5'000'000'000);
    EXPECT_EQ(client_->installedAssetMetrics(),
              PropertyList::map({{"_Count", 2U},
                                 {"_PhysicalSize", std::uint64_t{5'000'001'000}},
                                 {"_PurgeableSize", 0U}}));
    EXPECT_THAT(platform_.lines(),
                ElementsAre("AppRegistry.enumerateBundles(1)",
                            "8 default found 2 apps using 5000001000 bytes (0 purgeable)"));
}

TEST_F(InstalledAssetMetrics, AreAllThereOnAnEmptyDevice) {
    EXPECT_EQ(client_->installedAssetMetrics(),
              PropertyList::map({{"_Count", 0U}, {"_PhysicalSize", 0U}, {"_PurgeableSize", 0U}}));
}

TEST_F(InstalledAssetMetrics, LeaveOutOtherTypesThatTheWalkMeets) {
    add(kA, "Internal", 1000);
    EXPECT_EQ(client_->installedAssetMetrics().find("_Count")->asUnsigned(), 0U);
}

}  // namespace
}  // namespace appsync
