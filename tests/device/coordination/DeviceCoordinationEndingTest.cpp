#include <atomic>
#include <future>
#include <thread>

#include "device/values/DevicePaths.h"
#include "platform/FileURL.h"
#include "tests/device/coordination/DeviceCoordinationFixture.h"

namespace appsync {
namespace {

using Texts = std::vector<std::string>;

constexpr CoordinationClient kOther = 7;

ErrorRecord reason(std::int64_t code = 30) { return ErrorRecord::make("TRError", code, "enough"); }

class DeviceCoordinationEndingTest : public DeviceCoordinationFixture {
  protected:
    /// Has the database lose what it has of the coordinators, as a failed transaction does.
    void loseCoordinators() {
        ASSERT_TRUE(eventually([&] { return number("SELECT count(*) FROM coordinators") > 0; }));
        sql("DELETE FROM coordinators");
        EXPECT_FALSE(device().uninstall("com.example.none"));
    }
};

TEST_F(DeviceCoordinationEndingTest, aCancelEndsWhatTheDatabaseHasLost) {
    const auto made = prepare(kAtlas);
    loseCoordinators();
    made->cancelForReason(reason(), kOther);
    EXPECT_EQ(listener_->waitFor(2).back(), "cancelled com.example.atlas, client 7");
    EXPECT_TRUE(made->error());
    EXPECT_FALSE(recordOf(kAtlas));
}

TEST_F(DeviceCoordinationEndingTest, aFailureOfWhatTheDatabaseHasLostIsRemembered) {
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    const auto shown =
        service().makeAppPlaceholder("Atlas", kAtlas, kInstallTypeSync, SyncClientID);
    PlaceholderAttributes attributes;
    attributes.info.set("Nothing", PropertyList());  // no encoding can carry it
    ASSERT_TRUE(shown->setAttributes(attributes));
    ASSERT_TRUE(shown->setConfigurationComplete());
    loseCoordinators();
    EXPECT_FALSE(made->setPlaceholderPromise(shown));
    EXPECT_EQ(listener_->waitFor(2),
              (Texts{"no placeholder com.example.atlas", "failed com.example.atlas"}));
    EXPECT_EQ(number("SELECT count(*) FROM failures"), 1);
    EXPECT_FALSE(recordOf(kAtlas));
}

TEST_F(DeviceCoordinationEndingTest, aCancelTakesThePlaceholderAndLeavesTheOldVersion) {
    ASSERT_TRUE(install(kAtlas, "1.0"));
    const auto made = prepare(kAtlas, CoordinatorKind::Updating);
    stageIcon(kAtlas);
    made->cancelForReason(reason(), kOther);
    EXPECT_FALSE(hasPlaceholder(kAtlas));
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
    EXPECT_FALSE(exists(std::string(kPlaceholderFilesDirectory) + "/com.example.atlas.app"));
    EXPECT_EQ(listener_->waitFor(2).back(), "cancelled com.example.atlas, client 7");
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceCoordinationEndingTest, aSecondCancelIsNotHeard) {
    const auto made = prepare(kAtlas);
    EXPECT_EQ(listener_->waitFor(1).size(), 1U);
    made->cancelForReason(reason(1), SyncClientID);
    made->cancelForReason(reason(2), kOther);
    const auto next = prepare("com.example.boat");
    EXPECT_EQ(listener_->waitFor(3),
              (Texts{"placeholder com.example.atlas", "cancelled com.example.atlas, client 3",
                     "placeholder com.example.boat"}));
    EXPECT_EQ(made->error()->code, 1);
}

TEST_F(DeviceCoordinationEndingTest, anotherProcessMayCancelWhileTheSessionRuns) {
    const auto made = prepare(kAtlas);
    EXPECT_TRUE(succeeded(look()->cancelCoordinator(kAtlas, kOther)));
    EXPECT_EQ(listener_->waitFor(2).back(), "cancelled com.example.atlas, client 7");
    EXPECT_TRUE(made->error());
    EXPECT_FALSE(hasPlaceholder(kAtlas));
    EXPECT_FALSE(made->setAppAssetPromiseResponsibleClient(1));
    EXPECT_EQ(progressOf(kAtlas), nullptr);
    EXPECT_EQ(containers().size(), 0U);
}

TEST_F(DeviceCoordinationEndingTest, whatWasCancelledElsewhereIsNotFoundAnyMore) {
    const auto made = prepare(kAtlas);
    EXPECT_TRUE(succeeded(look()->cancelCoordinator(kAtlas, kOther)));
    const auto found = service().coordinator(CoordinatorKind::Initiating, kAtlas, SyncClientID,
                                             InstallCoordinatorService::Creation::OnlyExisting);
    EXPECT_EQ(found.coordinator, nullptr);
    EXPECT_FALSE(found.error);
    EXPECT_TRUE(made->error());
}

TEST_F(DeviceCoordinationEndingTest, whatWasCancelledElsewhereAndBegunAnewIsHeardOfAsBoth) {
    const auto made = prepare(kAtlas);
    EXPECT_EQ(listener_->waitFor(1).size(), 1U);
    EXPECT_TRUE(succeeded(look()->cancelCoordinator(kAtlas, kOther)));
    const auto next = prepare(kAtlas);
    EXPECT_EQ(listener_->waitFor(3),
              (Texts{"placeholder com.example.atlas", "cancelled com.example.atlas, client 7",
                     "placeholder com.example.atlas"}));
    EXPECT_TRUE(hasPlaceholder(kAtlas));
    EXPECT_FALSE(next->error());
}

TEST_F(DeviceCoordinationEndingTest, theLookOfTheCommandCreatesAndCancelsForOtherClients) {
    const auto beside = look();
    EXPECT_TRUE(succeeded(beside->createCoordinator(kAtlas, kOther)));
    const Status second = beside->createCoordinator(kAtlas, 8);
    ASSERT_FALSE(second);
    EXPECT_NE(second.error().description().find("client 7"), std::string::npos);
    const auto found =
        service().coordinator(CoordinatorKind::Initiating, kAtlas, SyncClientID,
                              InstallCoordinatorService::Creation::CreateIfNotExisting);
    ASSERT_NE(found.coordinator, nullptr);
    EXPECT_EQ(found.coordinator->creatorIdentifier(), kOther);
    EXPECT_EQ(recordOf(kAtlas)->kind, "initiating");
    EXPECT_TRUE(succeeded(beside->cancelCoordinator(kAtlas, kOther)));
    EXPECT_FALSE(beside->cancelCoordinator(kAtlas, kOther));
}

TEST_F(DeviceCoordinationEndingTest, aCreatedCoordinatorOfAnInstalledApplicationUpdatesIt) {
    ASSERT_TRUE(install(kAtlas));
    EXPECT_TRUE(succeeded(look()->createCoordinator(kAtlas, kOther)));
    EXPECT_EQ(recordOf(kAtlas)->kind, "updating");
}

TEST_F(DeviceCoordinationEndingTest, illegalIdentifiersAreRefused) {
    EXPECT_FALSE(look()->createCoordinator("../x", kOther));
    EXPECT_FALSE(look()->cancelCoordinator("../x", kOther));
}

TEST_F(DeviceCoordinationEndingTest, aDeviceWithoutCoordinationCreatesNone) {
    ASSERT_TRUE(look()->change({.coordination = false}));
    EXPECT_FALSE(service().isCoordinationEnabled());
    EXPECT_FALSE(look()->createCoordinator(kAtlas, kOther));
}

TEST_F(DeviceCoordinationEndingTest, statusTellsWhatIsMissingAndWhoseTaskItIs) {
    const auto made = prepare(kAtlas);
    made->appAssetPromise()->setPercentComplete(0.25);
    const Result<ApplicationStatus> status = device().status(kAtlas);
    ASSERT_TRUE(status.ok());
    ASSERT_TRUE(status->coordinator);
    EXPECT_EQ(status->coordinator->kind, "initiating");
    EXPECT_EQ(status->coordinator->client, SyncClientID);
    EXPECT_TRUE(status->coordinator->placeholderStands);
    EXPECT_FALSE(status->coordinator->isComplete);
    EXPECT_EQ(status->coordinator->waitsForClient, SyncClientID);
    EXPECT_NE(status->coordinator->waitsFor.find("package"), std::string::npos);
    ASSERT_EQ(status->coordinator->promises.size(), 1U);
    EXPECT_EQ(status->coordinator->promises[0].name, "com.example.atlas-Asset");
    EXPECT_DOUBLE_EQ(status->coordinator->promises[0].percent, 0.25);
}

TEST_F(DeviceCoordinationEndingTest, thePackageOfARestoreIsTheTaskOfTheResponsibleClient) {
    const auto made = coordinator(kAtlas, CoordinatorKind::Restoring);
    const auto shown = placeholder(kAtlas);
    ASSERT_TRUE(shown->setConfigurationComplete());
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    EXPECT_FALSE(recordOf(kAtlas)->waitsForClient);
    ASSERT_TRUE(made->setAppAssetPromiseResponsibleClient(AppStoreClientID));
    EXPECT_TRUE(eventually([&] { return recordOf(kAtlas)->waitsForClient == AppStoreClientID; }));
}

TEST_F(DeviceCoordinationEndingTest, anUninstallByAPersonCancelsTheInstall) {
    const auto made = prepare(kAtlas);
    EXPECT_TRUE(succeeded(look()->uninstall(kAtlas)));
    EXPECT_EQ(listener_->waitFor(2).back(), "cancelled com.example.atlas, client 0");
    EXPECT_FALSE(recordOf(kAtlas));
}

TEST_F(DeviceCoordinationEndingTest, anUninstallTakesThePlaceholderAndItsCoordinatorFirst) {
    ASSERT_TRUE(install(kAtlas));
    const auto made = prepare(kAtlas, CoordinatorKind::Updating);
    std::promise<std::optional<ErrorRecord>> done;
    service().uninstallApp(kAtlas, [&](const ErrorRecord* error) {
        done.set_value(error == nullptr ? std::nullopt : std::optional(*error));
    });
    EXPECT_FALSE(done.get_future().get());
    EXPECT_EQ(listener_->waitFor(2).back(), "cancelled com.example.atlas, client 0");
    EXPECT_TRUE(application(kAtlas));
    EXPECT_FALSE(hasPlaceholder(kAtlas));
}

TEST_F(DeviceCoordinationEndingTest, anUninstallEndsAnInstallThatHasNothingOnTheHomeScreen) {
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    std::promise<bool> done;
    service().uninstallApp(kAtlas, [&](const ErrorRecord* error) { done.set_value(!error); });
    EXPECT_TRUE(done.get_future().get());
    EXPECT_EQ(listener_->waitFor(1), Texts{"cancelled com.example.atlas, client 0"});
}

TEST_F(DeviceCoordinationEndingTest, everyUninstallIsReportedEvenWhenTheDeviceCloses) {
    std::atomic<int> completions = 0;
    for (int round = 0; round < 20; ++round) {
        service().uninstallApp("com.example.app" + std::to_string(round),
                               [&](const ErrorRecord*) { ++completions; });
    }
    endAndForget();
    EXPECT_EQ(completions, 20);
}

TEST_F(DeviceCoordinationEndingTest, aCancelAndAnInstallThatMeetEndInOneOfBoth) {
    for (int round = 0; round < 20; ++round) {
        const std::string identifier = "com.example.app" + std::to_string(round);
        const auto made = prepare(identifier);
        const std::string package = stagePackage(identifier);
        const std::size_t before =
            listener_->waitFor(2 * static_cast<std::size_t>(round) + 1).size();
        std::thread canceller([&] { made->cancelForReason(reason(), SyncClientID); });
        const auto promise = made->appAssetPromise();
        if (promise != nullptr) {
            promise->setTransferPath(FileURL::fromPath(package, false).value());
            promise->setComplete();
        }
        canceller.join();
        const Texts heard = listener_->waitFor(before + 1);
        ASSERT_EQ(heard.size(), before + 1);
        const bool completed = heard.back() == "complete " + identifier;
        EXPECT_EQ(application(identifier).has_value(), completed) << heard.back();
        EXPECT_FALSE(hasPlaceholder(identifier));
        EXPECT_FALSE(recordOf(identifier));
    }
    EXPECT_FALSE(device().databaseFailure());
}

TEST_F(DeviceCoordinationEndingTest, aHandleOutlivesTheDevice) {
    const auto made = prepare(kAtlas);
    const auto promise = made->appAssetPromise();
    endAndForget();
    EXPECT_EQ(made->bundleIdentifier(), kAtlas);
    EXPECT_TRUE(made->hasInstallOptions());
    EXPECT_FALSE(made->error());
    EXPECT_FALSE(made->setAppAssetPromiseResponsibleClient(1));
    promise->setPercentComplete(1.0);
    promise->setComplete();
    made->cancelForReason(reason(), SyncClientID);
}

TEST_F(DeviceCoordinationEndingTest, anObserverMayGoWhileItIsCalled) {
    struct Meeting {
        std::promise<void> called;
        std::promise<void> released;
    };
    auto mortal = std::make_shared<CoordinationListener>();
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    made->setObserver(mortal);
    // Shared with the listener, whose thread may be the last that lets go of it.
    const auto meeting = std::make_shared<Meeting>();
    mortal->setReaction([meeting](const std::string&) {
        meeting->called.set_value();
        meeting->released.get_future().wait();
    });
    made->cancelForReason(reason(), SyncClientID);
    meeting->called.get_future().wait();
    const std::weak_ptr<CoordinationListener> watch = mortal;
    mortal.reset();
    EXPECT_FALSE(watch.expired());
    meeting->released.set_value();
    EXPECT_TRUE(eventually([&] { return watch.expired(); }));
}

TEST_F(DeviceCoordinationEndingTest, noCallComesOnceTheDeviceIsGone) {
    std::vector<std::shared_ptr<InstallCoordinator>> all;
    for (int round = 0; round < 10; ++round) {
        const std::string identifier = "com.example.app" + std::to_string(round);
        all.push_back(prepare(identifier));
        deliver(*all.back(), stagePackage(identifier));
    }
    endAndForget();
    const std::size_t heard = listener_->heard().size();
    for (const auto& made : all) made->cancelForReason(reason(), SyncClientID);
    EXPECT_EQ(listener_->heard().size(), heard);
}

}  // namespace
}  // namespace appsync
