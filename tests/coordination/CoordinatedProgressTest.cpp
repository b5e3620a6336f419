#include "tests/coordination/CoordinationFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

/// An application whose coordinator has been set up.
class CoordinatedTransfer : public PreparedAppFixture {
  protected:
    CoordinatedTransfer() {
        EXPECT_TRUE(prepare());
        platform_.clearRecording();
    }

    bool update(double progress) {
        asset_->downloadProgress = progress;
        return client_->updateTransferProgressForApp(*asset_, false);
    }
    void complete(const ErrorRecord* error = nullptr) {
        client_->transferCompleteForApp(*asset_, error, false);
    }
    [[nodiscard]] std::vector<std::string> changes() const {
        return platform_.callsTo(
            {"PathTransferPromise.setPercentComplete", "PathTransferPromise.setTransferPath",
             "PathTransferPromise.setComplete", "InstallCoordinator.setAppAssetPromise",
             "InstallCoordinator.cancelForReason"});
    }
    /// Puts a coordinator without any piece in the place of the one that was set up.
    void startAnew() {
        service().cancel(kA, refusal_, SyncClientID);
        platform_.runUntilIdle();
        EXPECT_NE(coordinator(), nullptr);
        platform_.clearRecording();
    }

    const ErrorRecord error_ = ErrorRecord::make("Transport", 54, "the cable was pulled");
};

using CoordinatedProgress = CoordinatedTransfer;

TEST_F(CoordinatedProgress, IsThePromises) {
    asset_->installProgress = 0.125;
    EXPECT_TRUE(update(0.5));
    EXPECT_EQ(promise("-Asset").percent, 0.5);
    EXPECT_FALSE(promise("-Asset").complete);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Updating download progress: 0.500000 install progress:0.125000 for "
                       "com.example.a"));
}

TEST_F(CoordinatedProgress, OfAnUpdateIsFoundByItsKind) {
    EXPECT_FALSE(client_->updateTransferProgressForApp(*asset_, true));
    EXPECT_THAT(changes(), IsEmpty());
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService.coordinator"}),
                ElementsAre(HasSubstr("coordinator(updating, com.example.a, 3, only existing)")));
}

TEST_F(CoordinatedProgress, NeedsACoordinator) {
    asset_->identifier = kB;
    EXPECT_FALSE(update(0.5));
    EXPECT_EQ(service().state(kB), nullptr);
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(CoordinatedProgress, OfAFailedInstallChangesNothing) {
    service().setError(kA, refusal_);
    EXPECT_FALSE(update(0.5));
    EXPECT_THAT(changes(), IsEmpty());
}

TEST_F(CoordinatedProgress, AfterThePackageHasComeChangesNothing) {
    client_
        ->_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(kA, false, false, nullptr)
        ->appAssetPromise()
        ->setComplete();
    platform_.clearRecording();
    EXPECT_FALSE(update(0.5));
    EXPECT_THAT(changes(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default, "Asset promise is already satisfied for com.example.a"));
}

TEST_F(CoordinatedProgress, MakesThePromiseThatIsMissing) {
    startAnew();
    asset_->path = packagePath(kA);
    EXPECT_TRUE(update(0.25));
    EXPECT_EQ(promise("-Asset").percent, 0.25);
    EXPECT_EQ(promise("-Asset").path, FileURL::fromPath(packagePath(kA), false));
}

TEST_F(CoordinatedProgress, MakesAPromiseWithAnAbsolutePath) {
    startAnew();
    asset_->path = std::string(kA) + ".zip";
    EXPECT_TRUE(update(0.25));
    EXPECT_EQ(promise("-Asset").path, FileURL::fromPath(packagePath(kA), false));
}

TEST_F(CoordinatedProgress, MakesAPromiseWithoutAPathWhileThereIsNone) {
    startAnew();
    EXPECT_TRUE(update(0.25));
    EXPECT_EQ(promise("-Asset").path, std::nullopt);
}

TEST_F(CoordinatedProgress, IsNotUpdatedWhenThePromiseCannotBeMade) {
    startAnew();
    service().failNext(CoordinationStep::AppAssetPromise, kA, refusal_);
    EXPECT_FALSE(update(0.25));
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("Updating download progress"))));
}

using CoordinatedCompletion = CoordinatedTransfer;

TEST_F(CoordinatedCompletion, KeepsThePromise) {
    receive();
    complete();
    EXPECT_THAT(changes(),
                ElementsAre("PathTransferPromise.setTransferPath(com.example.a-Asset, "
                            "/var/mobile/Media/PublicStaging/com.example.a.zip)",
                            HasSubstr("PathTransferPromise.setPercentComplete(com.example.a-Asset"),
                            "PathTransferPromise.setComplete(com.example.a-Asset)"));
    EXPECT_EQ(promise("-Asset").percent, 1.0);
    EXPECT_TRUE(logged(LogLevel::Default, "Satisfying asset promise for com.example.a"));
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA));
}

TEST_F(CoordinatedCompletion, MakesThePromiseThatIsMissing) {
    startAnew();
    receive();
    complete();
    EXPECT_EQ(promise("-Asset").path, FileURL::fromPath(packagePath(kA), false));
    EXPECT_EQ(promise("-Asset").percent, 1.0);
    EXPECT_TRUE(promise("-Asset").complete);
    EXPECT_THAT(platform_.messages(),
                Contains("Added app asset promise to coordinator for 'com.example.a'"));
}

TEST_F(CoordinatedCompletion, DoesWithoutAPromiseThatIsRefused) {
    startAnew();
    receive();
    service().failNext(CoordinationStep::AppAssetPromise, kA, refusal_);
    complete();
    EXPECT_FALSE(promise("-Asset").complete);
    EXPECT_TRUE(logged(LogLevel::Default, "Satisfying asset promise for com.example.a"));
}

TEST_F(CoordinatedCompletion, ComesOnlyOnce) {
    receive();
    complete();
    platform_.clearRecording();
    complete();
    EXPECT_THAT(changes(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default, "Asset promise is already satisfied for com.example.a"));
}

TEST_F(CoordinatedCompletion, NeedsACoordinator) {
    asset_->identifier = kB;
    receive();
    complete();
    complete(&error_);
    EXPECT_THAT(changes(), IsEmpty());
}

TEST_F(CoordinatedCompletion, OfAFailedInstallChangesNothing) {
    service().setError(kA, refusal_);
    receive();
    complete();
    complete(&error_);
    EXPECT_THAT(changes(), IsEmpty());
}

TEST_F(CoordinatedCompletion, AtAPathThatNoUrlCanHoldCancelsTheCoordinator) {
    asset_->path = std::string("/a\0b", 4);
    complete();
    EXPECT_FALSE(promise("-Asset").complete);
    ASSERT_NE(service().ended(kA), nullptr);
    ASSERT_TRUE(service().ended(kA)->cancelled);
    EXPECT_EQ(service().ended(kA)->cancelled->reason,
              service().userPresentableError(1, ErrorRecord{"POSIX", 22, {}}));
}

TEST_F(CoordinatedCompletion, WithAnErrorCancelsTheCoordinator) {
    complete(&error_);
    EXPECT_EQ(service().state(kA), nullptr);
    ASSERT_NE(service().ended(kA), nullptr);
    const auto& cancelled = service().ended(kA)->cancelled;
    ASSERT_TRUE(cancelled);
    EXPECT_EQ(cancelled->client, SyncClientID);
    EXPECT_EQ(cancelled->reason, service().userPresentableError(1, error_));
    EXPECT_EQ(promise("-Asset").cancelled, std::nullopt);
    EXPECT_THAT(changes(), ElementsAre(HasSubstr("InstallCoordinator.cancelForReason")));
}

class CoordinatedSyncEnd : public PreparedAppFixture {};

TEST_F(CoordinatedSyncEnd, WithSuccessCancelsNothing) {
    EXPECT_TRUE(prepare());
    platform_.clearRecording();
    client_->assetSyncFinishedWithStatus(true, {kA});
    EXPECT_NE(service().state(kA), nullptr);
    EXPECT_THAT(platform_.lines(),
                ElementsAre("InstallCoordinatorService.existingCoordinator(com.example.a, 3) -> "
                            "com.example.a"));
}

TEST_F(CoordinatedSyncEnd, WithFailureCancelsWhatIsOutstanding) {
    EXPECT_TRUE(prepare());
    asset_->identifier = kB;
    EXPECT_TRUE(prepare());
    platform_.clearRecording();
    client_->assetSyncFinishedWithStatus(false, {kA, kB, kC});
    EXPECT_THAT(service().identifiers(), IsEmpty());
    EXPECT_EQ(service().ended(kA)->cancelled, (SimulatedCancel{{"TRError", 30, {}}, 3}));
    EXPECT_EQ(service().ended(kB)->cancelled, (SimulatedCancel{{"TRError", 30, {}}, 3}));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Cancelling coordinator with error Error Domain=TRError "
                            "Code=30 \"(null)\" for com.example.a",
                            "8 default Cancelling coordinator with error Error Domain=TRError "
                            "Code=30 \"(null)\" for com.example.b"));
}

TEST_F(CoordinatedSyncEnd, WithFailureCancelsWhatIsOutstandingWhoeverBeganIt) {
    service().addCoordinator(CoordinatorKind::Initiating, kA, AppStoreClientID);
    client_->assetSyncFinishedWithStatus(false, {kA});
    EXPECT_EQ(service().state(kA), nullptr);
    ASSERT_NE(service().ended(kA), nullptr);
    EXPECT_EQ(service().ended(kA)->cancelled, (SimulatedCancel{{"TRError", 30, {}}, 3}));
}

}  // namespace
}  // namespace appsync
