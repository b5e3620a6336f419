#include "tests/client/AppsClientFixture.h"
#include "tests/transfer/GoldenRecording.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// The recording of a session on a device whose installs are coordinated, see abbreviatedRecording.
constexpr std::string_view kWholeSession = R"(
8 default starting to reconcile sync with new anchor anchor 1
Lock#3.lock()
FileSystem.removeItem(TODO)
FileSystem.createDirectory(AREA, with intermediates, (null))
FileSystem.itemExists(MEDIA/ApplicationSync)
FileSystem.moveItem(MEDIA/ApplicationSync, TODO)
Lock#3.unlock()
DevicePolicyService.effectiveValue(AppRemovalAllowed)
FileSystem.readFile(TODO/ApplicationsSync.plist)
8 default B targeted for termination
8 default performing 1 deletions
InstallTransactionLog.logStep(7, 1, 1, yes, B, Uninstall app)
InstallCoordinatorService.uninstallApp(B)
NamedNotifications.registerForState(com.korvu.deskora.trd.wsyncnotify)
8 default Notifying DK we are starting syncing
HomeScreenService.blockableConnection()
NamedNotifications.setState(1, 1)
NamedNotifications.post(com.korvu.deskora.trd.wsyncnotify)
FileSystem.readFile(TODO/DeskoraIconState.plist)
FileSystem.writeFileAtomically(TODO/ApplicationsSync.plist-debug.plist)
8 default finished reconcile sync
8 default Uninstall of B with install coordinator succeeded wiht error (null).
InstallTransactionLog.logStep(7, 1, 2, yes, B, Uninstall app)
8 default getting installed assets
FileSystem.readFile(TODO/ApplicationsSync.plist)
FileSystem.readFile(AREA/LastSyncAppState.plist)
InstallerService.lookupUninstalled()
8 default finished getting installed assets toDoList:ENTRIES, uninstalled apps (), last synced apps(null)
DevicePolicyService.effectiveValue(AppInstallationAllowed)
FileSystem.readFile(TODO/ApplicationsSync.plist)
14 default outstandingAssetTransfers starting with todoList ENTRIES
AppRegistry.enumerateBundles(7)
8 default SystemAppPlaceholders ()
AppRegistry.enumerateBundles(0)
14 default outstandingAssetTransfers preExistingPlaceHolders {}, idsWeWant {}
WorkQueues.makeSemaphore(0)
AppRegistry.addObserver()
8 default Waiting for -applicationInstallsArePrioritized:arePaused: to complete...
Semaphore#1.wait()
AppRegistryObserver.applicationInstallsArePrioritized([], [])
14 default prioritized proxies () paused proxies ()
8 default No assets currently in progress.
8 default signaling semaphore
Semaphore#1.signal()
8 default Wait completed
AppRegistry.removeObserver()
8 default Assets already in progress (not returning these): ()
8 default Assets currently restoring: ()
HomeScreenService.blockableConnection()
HomeScreenConnection.flattenedIconState(1)
8 default saved icon sort order
FileSystem.writeFileAtomically(AREA/AssetSortOrder.plist)
8 default lastly A
FileSystem.removeItem(AREA/Icons)
FileSystem.createDirectory(AREA/Icons, alone, (null))
FileSystem.readFile(TODO/A/Info.plist)
IconRenderer.openBundle(TODO/A)
IconRenderer.homeScreenIcon(TODO/A)
IconRenderer.createImageDestination(public.png, 1)
ImageDestination.addImage(TODO/A)
ImageDestination.finalize()
FileSystem.writeFileAtomically(AREA/Icons/A.png)
FileSystem.readFile(AREA/RestoreState.plist)
8 default Asset A (pretty=Shown, version=1.0) prepped with icon file://AREA/Icons/A.png, at TODO/A, meta at TODO/A/VessikMetadata.plist, info at TODO/A/Info.plist, storePid=0, isRestore=n
AppRegistry.proxyForIdentifier(A, placeholders excluded)
FileSystem.readFile(TODO/A/Info.plist)
FileSystem.readFile(TODO/A/VessikMetadata.plist)
14 default processing app install for bundle 'A', title Shown assetplist {BundleDisplayName = Shown;}, version 1.0 with install coordination
InstallTransactionLog.logStep(1, 1, 1, yes, A, Install App)
InstallTransactionLog.logStep(3, 1, 1, yes, A, Create coordinator)
InstallCoordinatorService.coordinator(initiating, A, 3, create if not existing)
InstallCoordinator.creatorIdentifier(A)
8 default Created initiating coordinator Coordinator(A) (createIfNotExisting:1, existingApp:0) for A with error (null)
InstallTransactionLog.logStep(3, 1, 2, yes, A, Finished creating coordinator)
InstallCoordinator.setObserver(A)
InstallCoordinator.hasInstallOptions(A)
InstallCoordinator.setInstallOptions(A, {itemName = Sold;}, type 4, target 1)
8 default set install options on coordinator for A
InstallCoordinator.hasInitialODRAssetPromises(A)
InstallCoordinator.setInitialODRAssetPromises(A, [])
8 default set ZEL asset promise to install coordinator for A
InstallCoordinator.appAssetPromise(A)
InstallCoordinatorService.makePathTransferPromise(A-Asset, 3, (null), 0)
InstallCoordinator.setAppAssetPromise(A, A-Asset)
8 default Added app asset promise to coordinator for 'A'
InstallCoordinator.hasPlaceholderPromise(A)
FileSystem.temporaryDirectory()
FileSystem.createDirectory(/tmp/com.korvu.trd.Apps/A.app, with intermediates, mobile:mobile)
8 default Created app directory for 'A' at /tmp/com.korvu.trd.Apps/A.app with err=(null)
InstallTransactionLog.logStep(5, 1, 1, yes, A, Copying icon)
FileSystem.copyItem(AREA/Icons/A.png, /tmp/com.korvu.trd.Apps/A.app/Icon.png)
FileSystem.attributes(/tmp/com.korvu.trd.Apps/A.app/Icon.png)
8 default icon for A at /tmp/com.korvu.trd.Apps/A.app/Icon.png has a size of 69
8 default Copied icon from AREA/Icons/A.png to /tmp/com.korvu.trd.Apps/A.app/Icon.png with error (null) for 'A', sizeOnDisk:69
InstallTransactionLog.logStep(5, 1, 2, yes, A, Copying icon)
InstallTransactionLog.logStep(4, 1, 1, yes, A, Create placeholder)
InstallCoordinatorService.makeAppPlaceholder(Shown, A, 4, 3)
InstallTransactionLog.logStep(4, 1, 2, yes, A, Finished creating placeholder)
8 default Created placeholder Placeholder(A) for 'A' of type 4
InstallCoordinatorService.makePathTransferPromise(A-Icon, 3, /tmp/com.korvu.trd.Apps/A.app/Icon.png, 69)
PathTransferPromise.setPercentComplete(A-Icon, 1)
PathTransferPromise.setComplete(A-Icon)
InstallPlaceholder.setIconPromise(A, A-Icon)
8 default Added icon promise to placeholder for 'A'
InstallPlaceholder.setAttributes(A, {BundleDisplayName = Shown;}, version 1.0)
8 default set {info = {BundleDisplayName = Shown;}; launchProhibited = 0; bundleVersion = 1.0;} attributes on placeholder for A
InstallPlaceholder.setMetadata(A, {itemName = Sold;})
8 default set store metadata on placeholder for A
InstallPlaceholder.setConfigurationComplete(A)
8 default set placeholder configuration as complete for A
InstallCoordinator.setPlaceholderPromise(A, Shown)
8 default added placeholder promise to coordinator for A
8 default processing app install for bundle A finished with status 1 error (null)
InstallTransactionLog.logStep(1, 1, 2, yes, A, Install app)
SerialQueue#3.sync()
InstallCoordinatorObserver.coordinatorDidInstallPlaceholder(A)
InstallCoordinator.bundleIdentifier(A)
InstallCoordinator.error(A)
8 default coordinatorDidInstallPlaceholder for A with error (null)
SerialQueue#4.sync()
AppRegistryObserver.applicationInstallsArePrioritized([A (placeholder)], [])
8 default finished transferring 1.000000 for A
SerialQueue#3.sync()
InstallTransactionLog.logStep(3, 1, 1, yes, A, Create coordinator)
InstallCoordinatorService.coordinator(initiating, A, 3, only existing)
InstallCoordinator.creatorIdentifier(A)
8 default Created initiating coordinator Coordinator(A) (createIfNotExisting:0, existingApp:0) for A with error (null)
InstallTransactionLog.logStep(3, 1, 2, yes, A, Finished creating coordinator)
InstallCoordinator.error(A)
InstallCoordinator.appAssetPromise(A)
PathTransferPromise.isComplete(A-Asset)
8 default Updating download progress: 1.000000 install progress:0.000000 for A
PathTransferPromise.setPercentComplete(A-Asset, 1)
SerialQueue#3.sync()
8 default transfer for asset A ended with success y error (null) existingApp:0
8 default Not returning XOProgress * for A as tessarin is enabled
8 default asset transfer succeeded for A
8 default Received file at MEDIA/A.zip
Lock#3.lock()
FileSystem.readFile(TODO/ApplicationsSync.plist)
8 default Changing A from install to DOWNLOADED
FileSystem.writeFileAtomically(TODO/ApplicationsSync.plist)
Lock#3.unlock()
8 default Installing synced asset A
InstallTransactionLog.logStep(3, 1, 1, yes, A, Create coordinator)
InstallCoordinatorService.coordinator(initiating, A, 3, only existing)
InstallCoordinator.creatorIdentifier(A)
8 default Created initiating coordinator Coordinator(A) (createIfNotExisting:0, existingApp:0) for A with error (null)
InstallTransactionLog.logStep(3, 1, 2, yes, A, Finished creating coordinator)
InstallCoordinator.error(A)
InstallCoordinator.appAssetPromise(A)
PathTransferPromise.isComplete(A-Asset)
PathTransferPromise.setTransferPath(A-Asset, MEDIA/A.zip)
8 default Satisfying asset promise for A
PathTransferPromise.setPercentComplete(A-Asset, 1)
PathTransferPromise.setComplete(A-Asset)
8 default asset transfer ended withsuccess: y
WaitGroup#3.wait()
NamedNotifications.registerForState(com.korvu.deskora.trd.wsyncnotify)
8 default Notifying DK we are done syncing
HomeScreenService.blockableConnection()
NamedNotifications.setState(2, 0)
NamedNotifications.post(com.korvu.deskora.trd.wsyncnotify)
8 default sync ended with success: y
FileSystem.setTimesToNow(AREA)
8 default clearing uninstalled apps: ()
InstallerService.clearUninstalled()
FileSystem.removeItem(AREA/LastSyncAppState.plist)
InstallCoordinatorObserver.coordinatorDidCompleteSuccessfully(A)
InstallCoordinator.bundleIdentifier(A)
InstallCoordinator.error(A)
8 default coordinatorDidCompleteSuccessfully for A with error (null)
Lock#3.lock()
FileSystem.readFile(TODO/ApplicationsSync.plist)
8 default Changing A from DOWNLOADED to INSTALLED
FileSystem.writeFileAtomically(TODO/ApplicationsSync.plist)
Lock#3.unlock()
Lock#4.lock()
FileSystem.readFile(AREA/RestoreState.plist)
Lock#4.unlock()
AppRegistryObserver.applicationInstallsArePrioritized([], [])
)";

class CoordinatedSession : public AppsClientFixture {
  protected:
    CoordinatedSession() {
        makeCoordinatedClient();
        // As the daemon's start does.
        platform_.notificationCenter.post("com.korvu.trd.TRStartupCompleteNotification");
        platform_.runUntilIdle();
        platform_.clearRecording();
    }
    /// A session that installs one application and removes another.
    void stageOneOfEach() {
        platform_.registry.addApplication(kB);
        stage(PropertyList::array({todoEntry(kA, "install"), todoEntry(kB, "remove")}));
        const std::string sideFiles = std::string(kStagingArea) + "/" + kA;
        platform_.addPropertyList(sideFiles + "/Info.plist",
                                  PropertyList::map({{"BundleDisplayName", "Shown"}}));
        platform_.addPropertyList(sideFiles + "/VessikMetadata.plist",
                                  PropertyList::map({{"itemName", "Sold"}}));
    }
    void transfer(const SyncAssetPointer& asset) {
        asset->downloadProgress = 1.0;
        client_->assetTransferUpdatedProgress(asset, 1.0);
        asset->path = asset->identifier + ".zip";
        platform_.files.addFile(packagePath(asset->identifier), "package");
        client_->assetTransferSucceeded(asset, true, nullptr);
    }
    /// How many assets were asked for.
    std::size_t run() {
        EXPECT_TRUE(client_->prepareForSyncWithHostAnchor("anchor 0", {}, nullptr));
        EXPECT_TRUE(client_->reconcileSync({}, "anchor 1", {}, nullptr));
        platform_.runUntilIdle();
        static_cast<void>(client_->installedAssets());
        const std::vector<SyncAssetPointer> assets = client_->outstandingAssetTransfers();
        platform_.runUntilIdle();
        for (const SyncAssetPointer& asset : assets) transfer(asset);
        client_->assetTransferEndedWithSuccess(true);
        client_->syncEndedWithSuccess(true);
        platform_.runUntilIdle();
        return assets.size();
    }
};

TEST_F(CoordinatedSession, MakesEveryCallAndWritesEveryMessageInOrder) {
    stageOneOfEach();
    EXPECT_EQ(run(), 1U);
    EXPECT_EQ(abbreviatedRecording(platform_), kWholeSession);
}

TEST_F(CoordinatedSession, LeavesTheDeviceInStepWithTheList) {
    stageOneOfEach();
    EXPECT_EQ(run(), 1U);
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA));
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), IsEmpty());
    EXPECT_THAT(platform_.coordination.identifiers(), IsEmpty());
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_FALSE(platform_.files.exists(packagePath(kA)));
}

TEST_F(CoordinatedSession, UpdatesWhatIsInstalled) {
    platform_.registry.addApplication(kA, "0.9");
    stageOneOfEach();
    EXPECT_EQ(run(), 1U);
    EXPECT_EQ(platform_.coordination.ended(kA)->kind, CoordinatorKind::Updating);
    EXPECT_EQ(platform_.coordination.ended(kA)->error, std::nullopt);
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(CoordinatedSession, GoesOnAfterOneThatWasCutShort) {
    stageOneOfEach();
    EXPECT_TRUE(client_->reconcileSync({}, "anchor 1", {}, nullptr));
    EXPECT_EQ(client_->outstandingAssetTransfers().size(), 1U);
    platform_.runUntilIdle();
    stage(PropertyList::array({todoEntry(kA, "install")}));
    EXPECT_EQ(run(), 1U);
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA));
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(CoordinatedSession, RemovesThroughTheServiceOnly) {
    stageOneOfEach();
    EXPECT_EQ(run(), 1U);
    EXPECT_THAT(platform_.callsTo({"AppRegistry.uninstallApplication"}), IsEmpty());
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService.uninstallApp"}),
                ElementsAre("InstallCoordinatorService.uninstallApp(com.example.b)"));
    EXPECT_THAT(platform_.transactions.scenarios(), IsEmpty());
}

}  // namespace
}  // namespace appsync
