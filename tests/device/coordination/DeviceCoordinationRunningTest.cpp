#include "tests/device/coordination/DeviceCoordinationFixture.h"

namespace appsync {
namespace {

/// An update of an application that runs.
class DeviceCoordinationRunningTest : public DeviceCoordinationFixture {
  protected:
    void updateWhileItRuns() {
        ASSERT_TRUE(install(kAtlas, "1.0"));
        ASSERT_TRUE(device().run(kAtlas));
        coordinator_ = prepare(kAtlas, CoordinatorKind::Updating);
        deliver(*coordinator_, stagePackage(kAtlas, "2.0"));
        ASSERT_TRUE(eventually([this] { return denial().has_value(); }));
    }
    std::optional<TerminationDenial> denial() {
        const Result<ApplicationStatus> status = device().status(kAtlas);
        return status ? status->denial : std::nullopt;
    }

    std::shared_ptr<InstallCoordinator> coordinator_;
};

TEST_F(DeviceCoordinationRunningTest, anApplicationThatRunsIsNotReplacedAndStatusTellsWhy) {
    updateWhileItRuns();
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
    EXPECT_EQ(denial()->nextTry - denial()->when, std::chrono::seconds(30));
    const Result<ApplicationStatus> status = device().status(kAtlas);
    EXPECT_TRUE(status->coordinator->isComplete);
    EXPECT_EQ(device().coordinatedInstallsUnderWay(), std::vector<std::string>{kAtlas});
}

TEST_F(DeviceCoordinationRunningTest, theUpdateComesAsSoonAsTheApplicationIsQuit) {
    updateWhileItRuns();
    ASSERT_TRUE(look()->quit(kAtlas));
    EXPECT_EQ(listener_->waitFor(2).back(), "complete com.example.atlas");
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
    EXPECT_FALSE(denial());
}

TEST_F(DeviceCoordinationRunningTest, othersAreInstalledMeanwhile) {
    updateWhileItRuns();
    const auto other = prepare("com.example.boat");
    deliver(*other, stagePackage("com.example.boat"));
    EXPECT_EQ(listener_->waitFor(3).back(), "complete com.example.boat");
}

TEST_F(DeviceCoordinationRunningTest, aCancelEndsTheWaitAndTheDenial) {
    updateWhileItRuns();
    coordinator_->cancelForReason(ErrorRecord::make("Test", 1, "no"), SyncClientID);
    EXPECT_EQ(listener_->waitFor(2).back(), "cancelled com.example.atlas, client 3");
    EXPECT_FALSE(denial());
    ASSERT_TRUE(device().quit(kAtlas));
    EXPECT_TRUE(device().waitForCoordinatedInstalls(std::chrono::seconds(60)));
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
}

TEST_F(DeviceCoordinationRunningTest, anApplicationMayRunOnceItsUpdateHasBeenToldOf) {
    ASSERT_TRUE(install(kAtlas, "1.0"));
    const auto made = prepare(kAtlas, CoordinatorKind::Updating);
    deliver(*made, stagePackage(kAtlas, "2.0"));
    EXPECT_TRUE(device().waitForCoordinatedInstalls(std::chrono::seconds(60)));
    EXPECT_TRUE(device().run(kAtlas));
}

TEST_F(DeviceCoordinationRunningTest, theServiceAsksAgainAtTheRetryInterval) {
    ASSERT_TRUE(install(kAtlas, "1.0"));
    ASSERT_TRUE(device().run(kAtlas));
    {
        const auto made = prepare(kAtlas, CoordinatorKind::Updating);
        deliver(*made, stagePackage(kAtlas, "2.0"));
    }
    endAndForget();
    DeviceOpenOptions options{.access = DeviceAccess::Session};
    options.retryInterval = std::chrono::seconds(0);
    auto opened = Device::open(devicePath(), options);
    ASSERT_TRUE(opened.ok());
    ASSERT_TRUE((*opened)->startCoordination());
    std::optional<WallTime> first;
    EXPECT_TRUE(eventually([&] {
        const Result<ApplicationStatus> status = (*opened)->status(kAtlas);
        if (!status || !status->denial) return false;
        if (!first) first = status->denial->when;
        return status->denial->when > *first;
    }));
}

TEST_F(DeviceCoordinationRunningTest, whatWaitsWhenTheSessionEndsIsDoneByTheNext) {
    updateWhileItRuns();
    coordinator_.reset();
    endAndForget();
    EXPECT_EQ(recordOf(kAtlas)->kind, "updating");
    ASSERT_TRUE(look()->quit(kAtlas));
    ASSERT_TRUE(device().startCoordination());
    EXPECT_TRUE(device().waitForCoordinatedInstalls(std::chrono::seconds(60)));
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
}

}  // namespace
}  // namespace appsync
