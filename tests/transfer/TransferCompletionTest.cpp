#include "tests/transfer/TransferEventsFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using Access = AppsClientTestAccess;

class TransferCompletion : public TransferEventsFixture {};

TEST_F(TransferCompletion, ForgetATransferThatHasEnded) {
    progress(0.5);
    Access::updatingApps(*client_) = {kA, kB};
    Access::userCancelledApps(*client_) = {kA};
    succeed(receivedAsset(kA));
    EXPECT_THAT(outstanding(), IsEmpty());
    EXPECT_THAT(Access::updatingApps(*client_), ElementsAre(kB));
    EXPECT_THAT(Access::userCancelledApps(*client_), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "transfer for asset com.example.a ended with success y error (null) "
                       "existingApp:1"));
}

TEST_F(TransferCompletion, InstallAPackageThatHasArrived) {
    succeed(receivedAsset(kA));
    EXPECT_EQ(platform_.registry.installedIdentifiers(), std::vector<std::string>{kA});
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_THAT(platform_.messages(), testing::Not(Contains(HasSubstr("Ignoring invalid path"))));
    for (const char* text : {"asset transfer succeeded for com.example.a",
                             "Received file at /var/mobile/Media/PublicStaging/com.example.a.zip",
                             "Changing com.example.a from install to DOWNLOADED",
                             "Installing synced asset com.example.a"}) {
        EXPECT_TRUE(logged(LogLevel::Default, text)) << text;
    }
    EXPECT_THAT(platform_.callsTo({"AppRegistry.finishInstallPhase"}),
                ElementsAre("AppRegistry.finishInstallPhase(com.example.a)"));
}

TEST_F(TransferCompletion, InstallAPackageWithoutAProgressRecord) {
    platform_.registry.removeProgress(kA);
    succeed(receivedAsset(kA));
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_THAT(platform_.callsTo({"AppRegistry.finishInstallPhase"}), IsEmpty());
}

TEST_F(TransferCompletion, TakeARelativePathToBeInTheStagingDirectory) {
    auto asset = receivedAsset(kA);
    asset->path = "x.pkg";
    platform_.files.addFile("/var/mobile/Media/PublicStaging/x.pkg", "package");
    succeed(asset);
    EXPECT_EQ(asset->path, "/var/mobile/Media/PublicStaging/x.pkg");
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(TransferCompletion, KeepAnAbsolutePath) {
    auto asset = receivedAsset(kA);
    asset->path = "/elsewhere/x.pkg";
    platform_.files.addFile("/elsewhere/x.pkg", "package");
    succeed(asset);
    EXPECT_EQ(asset->path, "/elsewhere/x.pkg");
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(TransferCompletion, RefuseAPathThatIsNotSafe) {
    for (const char* path : {"/a/../b", "a/..b"}) {
        auto asset = receivedAsset(kA);
        asset->path = path;
        succeed(asset);
    }
    EXPECT_TRUE(logged(LogLevel::Default, "Ignoring invalid path: /a/../b"));
    EXPECT_TRUE(
        logged(LogLevel::Default, "Ignoring invalid path: /var/mobile/Media/PublicStaging/a/..b"));
    EXPECT_EQ(operationOf(kA), "install");
    EXPECT_THAT(installs(), IsEmpty());
}

TEST_F(TransferCompletion, FinishTheInstallPhaseBeforeThePathIsLookedAt) {
    auto asset = receivedAsset(kA);
    asset->path = "/a/../b";
    succeed(asset);
    EXPECT_THAT(platform_.callsTo({"AppRegistry.finishInstallPhase"}),
                ElementsAre("AppRegistry.finishInstallPhase(com.example.a)"));
}

TEST_F(TransferCompletion, RefuseAMissingPath) {
    auto asset = receivedAsset(kA);
    asset->path.reset();
    succeed(asset);
    EXPECT_TRUE(logged(LogLevel::Default, "Ignoring invalid path: (null)"));
    EXPECT_EQ(operationOf(kA), "install");
}

TEST_F(TransferCompletion, TakeAMissingPathFromTheRestoreState) {
    client_->_setRestoreStatePropertyValue(packagePath(kA), "path", kA, &kOneZero);
    auto asset = receivedAsset(kA);
    asset->path.reset();
    succeed(asset);
    EXPECT_EQ(asset->path, packagePath(kA));
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(TransferCompletion, TakeTheMissingPathOfTheirOwnVersion) {
    const std::string version = "2.5";
    client_->_setRestoreStatePropertyValue("/old.zip", "path", kA, &kOneZero);
    client_->_setRestoreStatePropertyValue(packagePath(kA), "path", kA, &version);
    auto asset = receivedAsset(kA);
    asset->path.reset();
    asset->variantOptions.set("Version", version);
    succeed(asset);
    EXPECT_EQ(asset->path, packagePath(kA));
}

TEST_F(TransferCompletion, DoNotTakeAPathThatIsNoString) {
    client_->_setRestoreStatePropertyValue(7, "path", kA, &kOneZero);
    auto asset = receivedAsset(kA);
    asset->path.reset();
    succeed(asset);
    EXPECT_TRUE(logged(LogLevel::Default, "Ignoring invalid path: (null)"));
}

TEST_F(TransferCompletion, MarkAnUploadAsSent) {
    auto asset = receivedAsset(kA);
    asset->isDownload = false;
    succeed(asset);
    EXPECT_EQ(operationOf(kA), "SENT");
    EXPECT_THAT(installs(), IsEmpty());
}

TEST_F(TransferCompletion, InstallARestoreWithoutDataAtOnce) {
    succeed(restoreAsset(kAssetPartApplication));
    EXPECT_TRUE(logged(LogLevel::Default, "No restore data exists for com.example.a"));
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(TransferCompletion, ParkARestoreWhoseDataIsStillToCome) {
    platform_.backup.addRestoreData(kA);
    succeed(restoreAsset(kAssetPartApplication));
    EXPECT_THAT(installs(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default, "Restore data exists for com.example.a"));
    EXPECT_EQ(values().phase, kInstallPhaseRestoringData);
    EXPECT_EQ(client_->_restoreStatePropertyForKey("path", kA, &kOneZero),
              PropertyList(packagePath(kA)));
    EXPECT_EQ(operationOf(kA), "DOWNLOADED");
    EXPECT_TRUE(platform_.files.exists(packagePath(kA)));
}

TEST_F(TransferCompletion, ParkARestoreUnderItsVersion) {
    const std::string version = "2.5";
    platform_.backup.addRestoreData(kA);
    auto asset = restoreAsset(kAssetPartApplication);
    asset->variantOptions.set("Version", version);
    succeed(asset);
    EXPECT_EQ(client_->_restoreStatePropertyForKey("path", kA, &version),
              PropertyList(packagePath(kA)));
    EXPECT_FALSE(client_->_restoreStatePropertyForKey("path", kA, &kOneZero));
}

TEST_F(TransferCompletion, ParkARestoreWithoutAProgressRecordToo) {
    platform_.backup.addRestoreData(kA);
    platform_.registry.removeProgress(kA);
    succeed(restoreAsset(kAssetPartBoth));
    EXPECT_TRUE(client_->_restoreStatePropertyForKey("path", kA, &kOneZero));
}

TEST_F(TransferCompletion, InstallAParkedRestoreWhenItsDataHasArrived) {
    platform_.backup.addRestoreData(kA);
    succeed(restoreAsset(kAssetPartApplication));
    auto asset = restoreAsset(kAssetPartApplicationData);
    asset->path.reset();
    succeed(asset);
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_FALSE(platform_.files.exists(std::string(kRestoreStatePath)));
}

}  // namespace
}  // namespace appsync
