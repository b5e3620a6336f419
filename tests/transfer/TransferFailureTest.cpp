#include "tests/transfer/TransferEventsFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

class TransferFailure : public TransferEventsFixture {};

TEST_F(TransferFailure, KeepThePlaceholderAfterAFailureThatCanBeRecovered) {
    platform_.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    progress(0.5);
    fail(receivedAsset(kA));
    EXPECT_EQ(values().state, kInstallStateFailed);
    EXPECT_THAT(uninstalls(), IsEmpty());
    EXPECT_THAT(outstanding(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "failed to transfer asset com.example.a. err=Error Domain=Transport "
                       "Code=54 \"the cable was pulled\", recoverable=1"));
}

TEST_F(TransferFailure, SurviveARecoverableFailureWithoutAProgressRecord) {
    platform_.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    platform_.registry.removeProgress(kA);
    fail(receivedAsset(kA));
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

TEST_F(TransferFailure, RemoveThePlaceholderAfterAnyOtherFailure) {
    fail(receivedAsset(kA));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
    EXPECT_THAT(platform_.callsTo({"InstallProgressRecord.cancel"}), testing::SizeIs(1));
    EXPECT_THAT(uninstalls(),
                ElementsAre("AppRegistry.uninstallApplication(com.example.a, {PlaceholderOnly = "
                            "1;}) -> ok"));
    EXPECT_TRUE(logged(LogLevel::Default, "Uninstalling placeholder com.example.a"));
    EXPECT_TRUE(logged(LogLevel::Default, "Uninstalling app using RG com.example.a secceeded"));
    EXPECT_EQ(operationOf(kA), "install");
}

TEST_F(TransferFailure, LeaveTheInstalledVersionOfAFailedUpdate) {
    platform_.registry.addApplication(kA, "0.9");
    fail(receivedAsset(kA));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
    EXPECT_TRUE(platform_.registry.installed(kA));
}

TEST_F(TransferFailure, DoNotCancelAnInstallThatIsOver) {
    platform_.registry.setProgress(kA, {kInstallStateCanceled, kInstallPhaseLoading, 0, 0});
    fail(receivedAsset(kA));
    EXPECT_THAT(platform_.callsTo({"InstallProgressRecord.cancel"}), IsEmpty());
    EXPECT_FALSE(platform_.registry.placeholder(kA));
}

/// The state that the record is in when the transfer fails.
class TransferFailureInState : public TransferFailure,
                               public testing::WithParamInterface<std::uint64_t> {};

TEST_P(TransferFailureInState, CancelTheRecordUnlessItIsOver) {
    platform_.registry.setProgress(kA, {GetParam(), kInstallPhaseLoading, 0, 0});
    fail(receivedAsset(kA));
    const bool isOver = GetParam() >= kInstallStateCanceled;
    EXPECT_THAT(platform_.callsTo({"InstallProgressRecord.cancel"}),
                testing::SizeIs(isOver ? 0 : 1));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
}

INSTANTIATE_TEST_SUITE_P(EveryState, TransferFailureInState,
                         testing::Range(std::uint64_t{kInstallStateWaiting},
                                        std::uint64_t{kInstallStateFinished} + 1));

TEST_F(TransferFailure, SayThatThePlaceholderCannotBeRemoved) {
    platform_.registry.removeProgress(kA);
    platform_.registry.failNextUninstall(kA, ErrorRecord::make(kRegistryErrorDomain, 1, "no"));
    fail(receivedAsset(kA));
    EXPECT_TRUE(logged(LogLevel::Default, "Uninstalling app using RG com.example.a failed"));
}

TEST_F(TransferFailure, RemoveNothingWhenThereIsNothing) {
    fail(receivedAsset(kB));
    EXPECT_THAT(uninstalls(), IsEmpty());
    EXPECT_THAT(platform_.messages(), Not(Contains(StartsWith("Uninstalling"))));
}

TEST_F(TransferFailure, ChangeNothingOnTheDeviceWhenARestoreFails) {
    const Values before = values();
    fail(restoreAsset(kAssetPartApplication));
    EXPECT_TRUE(platform_.registry.placeholder(kA));
    EXPECT_EQ(values(), before);
    EXPECT_THAT(uninstalls(), IsEmpty());
    EXPECT_THAT(platform_.backup.cancelled(), IsEmpty());
}

TEST_F(TransferFailure, OnlyMarkARestoreThatFailsRecoverably) {
    platform_.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    fail(restoreAsset(kAssetPartApplication));
    EXPECT_EQ(values().state, kInstallStateFailed);
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

TEST_F(TransferFailure, TakeAFailureWithoutAnErrorForFinal) {
    platform_.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    client_->assetTransferSucceeded(receivedAsset(kA), false, nullptr);
    EXPECT_FALSE(platform_.registry.placeholder(kA));
    EXPECT_THAT(platform_.callsTo({"SyncHost.isRecoverableError"}), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "failed to transfer asset com.example.a. err=(null), recoverable=0"));
}

TEST_F(TransferFailure, EndTheTransferOfARestoreThatIsCancelledOnTheDevice) {
    platform_.registry.addPlaceholder(kB, kInstallTypeRestore);
    client_->assetTransferUpdatedProgress(receivedAsset(kB), 0.5);
    platform_.registry.cancelInstalls({kB});
    platform_.runUntilIdle();
    EXPECT_THAT(outstanding(), IsEmpty());
    EXPECT_FALSE(platform_.registry.placeholder(kB));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "transfer for asset com.example.b ended with success n error Error "
                       "Domain=TRError Code=2 \"(null)\" existingApp:0"));
}

TEST_F(TransferFailure, DoNotHeedOtherInstallsThatAreCancelledOnTheDevice) {
    progress(0.5);
    platform_.registry.cancelInstalls({kA});
    platform_.runUntilIdle();
    EXPECT_THAT(outstanding(), ElementsAre(kA));
    EXPECT_THAT(platform_.messages(), Not(Contains(StartsWith("transfer for asset"))));
}

/// No restore gets as far as to be given up: its failure has ended before. Here the asset becomes
/// one on the way, at the call of this name.
class TransferFailureOfALateRestore : public TransferFailure {
  protected:
    void failAsRestoreFrom(const std::string& call, bool coordinated) {
        const auto asset = receivedAsset(kA);
        platform_.onCall(call, [this, asset, coordinated](const RecordEntry&) {
            asset->isRestore = true;
            AppsClientTestAccess::setUseInstallCoordinator(*client_, coordinated);
        });
        fail(asset);
    }
};

TEST_F(TransferFailureOfALateRestore, GivesTheRestoreUp) {
    failAsRestoreFrom("InstallProgressRecord.cancel", false);
    EXPECT_THAT(platform_.backup.cancelled(), ElementsAre(kA));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
}

TEST_F(TransferFailureOfALateRestore, LeavesACoordinatedRestoreAlone) {
    failAsRestoreFrom("InstallProgressRecord.cancel", true);
    EXPECT_THAT(platform_.backup.cancelled(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Install coordination is enabled - not calling "
                       "cancelApplicationRestoreWithBundleID for com.example.a"));
}

}  // namespace
}  // namespace appsync
