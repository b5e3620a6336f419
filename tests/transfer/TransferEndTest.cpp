#include "tests/transfer/TransferEventsFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;
using Access = AppsClientTestAccess;

class TransferEnd : public TransferEventsFixture {};

TEST_F(TransferEnd, TellsTheHomeScreenAndForgetsTheAttempts) {
    succeed(receivedAsset(kA));
    Access::updatingApps(*client_) = {kB};
    Access::userCancelledApps(*client_) = {kC};
    platform_.clearRecording();
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default asset transfer ended withsuccess: y",
                            "8 default Notifying DK we are done syncing"));
    EXPECT_THAT(platform_.notifications.posts(),
                ElementsAre("com.korvu.deskora.trd.wsyncnotify=0"));
    EXPECT_EQ(client_->_getAndResetNumAppInstallsAttempted(), 0U);
    EXPECT_THAT(Access::updatingApps(*client_), ElementsAre(kB));
    EXPECT_THAT(Access::userCancelledApps(*client_), ElementsAre(kC));
}

TEST_F(TransferEnd, WaitsForTheInstalls) {
    platform_.registry.setInstallDuration(std::chrono::minutes(5));
    client_->assetTransferSucceeded(receivedAsset(kA), true, nullptr);
    EXPECT_EQ(operationOf(kA), "DOWNLOADED");
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_EQ(platform_.now(), std::chrono::minutes(5));
}

TEST_F(TransferEnd, ClosesOutstandingTransfersAsFailed) {
    progress(0.5);
    Access::updatingApps(*client_) = {kB};
    Access::userCancelledApps(*client_) = {kC};
    platform_.clearRecording();
    client_->assetTransferEndedWithSuccess(false);
    EXPECT_TRUE(logged(LogLevel::Default, "asset transfer ended withsuccess: n"));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Setting state for outstanding HFT loading phase of asset com.example.a to "
                       "RGInstallStateFailed"));
    EXPECT_THAT(platform_.callsTo(
                    {"InstallProgressRecord.setInstallState", "AppRegistry.finishInstallPhase"}),
                ElementsAre("InstallProgressRecord.setInstallState(com.example.a, 4)",
                            "AppRegistry.finishInstallPhase(com.example.a)"));
    EXPECT_THAT(outstanding(), IsEmpty());
    EXPECT_THAT(Access::updatingApps(*client_), IsEmpty());
    EXPECT_THAT(Access::userCancelledApps(*client_), IsEmpty());
    EXPECT_THAT(platform_.messages(), Not(Contains(StartsWith("Called with success"))));
}

TEST_F(TransferEnd, ReportsASuccessWithOutstandingTransfers) {
    progress(0.5);
    client_->assetTransferUpdatedProgress(receivedAsset(kB), 0.5);  // without a record
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_TRUE(logged(LogLevel::Error,
                       "Called with success == YES but with 2 outstanding HFT transfers!"));
    for (const std::string identifier : {kA, kB}) {
        EXPECT_TRUE(
            logged(LogLevel::Default, "Setting state for outstanding HFT loading phase of asset " +
                                          identifier + " to RGInstallStateFinished"));
    }
    EXPECT_THAT(outstanding(), IsEmpty());
}

TEST_F(TransferEnd, ForgetsUpdatesAndCancelsAfterASuccessWithOutstandingTransfers) {
    progress(0.5);
    Access::updatingApps(*client_) = {kB};
    Access::userCancelledApps(*client_) = {kC};
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_THAT(Access::updatingApps(*client_), IsEmpty());
    EXPECT_THAT(Access::userCancelledApps(*client_), IsEmpty());
}

}  // namespace
}  // namespace appsync
