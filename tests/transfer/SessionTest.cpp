#include "tests/client/AppsClientFixture.h"
#include "tests/transfer/GoldenRecording.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// The recording of a session, see abbreviatedRecording.
constexpr std::string_view kWholeSession = R"(
8 default starting to reconcile sync with new anchor anchor 1
Lock#1.lock()
FileSystem.removeItem(TODO)
FileSystem.createDirectory(AREA, with intermediates, (null))
FileSystem.itemExists(MEDIA/ApplicationSync)
FileSystem.moveItem(MEDIA/ApplicationSync, TODO)
Lock#1.unlock()
DevicePolicyService.effectiveValue(AppRemovalAllowed)
FileSystem.readFile(TODO/ApplicationsSync.plist)
8 default B targeted for termination
8 default performing 1 deletions
AppRegistry.uninstallApplication(B, (null))
InstallTransactionLog.logScenario(Vessik Sync, 0, yes, B, Uninstall succeeded)
NamedNotifications.registerForState(com.korvu.deskora.trd.wsyncnotify)
8 default Notifying DK we are starting syncing
HomeScreenService.blockableConnection()
NamedNotifications.setState(1, 1)
NamedNotifications.post(com.korvu.deskora.trd.wsyncnotify)
FileSystem.readFile(TODO/DeskoraIconState.plist)
8 default Sending iconlayout to DK
HomeScreenService.blockableConnection()
HomeScreenConnection.setIconState()
FileSystem.writeFileAtomically(TODO/ApplicationsSync.plist-debug.plist)
8 default finished reconcile sync
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
8 default prioritize A
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
8 default plist TODO/A/Info.plist
FileSystem.readFile(TODO/A/Info.plist)
FileSystem.temporaryDirectory()
FileSystem.createDirectory(/tmp/com.korvu.trd.Apps/A.app, with intermediates, mobile:mobile)
8 default Created app directory for 'A' at /tmp/com.korvu.trd.Apps/A.app with err=(null)
FileSystem.copyItem(AREA/Icons/A.png, /tmp/com.korvu.trd.Apps/A.app/Icon.png)
FileSystem.writeFileAtomically(/tmp/com.korvu.trd.Apps/A.app/Info.plist)
8 default creating placeholder for 'A'. info.plist={BundleIdentifier = A; BundleVersion = 1.0; BundleExecutable = Shown; BundleDisplayName = Shown; BundleIconFile = Icon.png; VKPresselApp = 0; RGApplicationLaunchProhibited = 0;}
AppRegistry.installPlaceholderBundle(/tmp/com.korvu.trd.Apps/A.app, {PackageType = Placeholder; BundleIdentifier = A; RGInstallType = 4;})
8 default Installed Placeholder app from path /tmp/com.korvu.trd.Apps/A.app: Shown [A 1.0] [isPressel: 0]
InstallTransactionLog.logScenario(Install placeholder, 0, yes, A, Installed placeholder)
8 default finished transferring 1.000000 for A
AppRegistry.proxyForIdentifier(A, placeholders included)
AppRegistry.installProgress(A (placeholder), 0)
InstallProgressRecord.description(A)
8 error Returning A state=0 phase=0 0/0 progress for A
InstallProgressRecord.setInstallState(A, 1)
InstallProgressRecord.totalUnitCount(A)
InstallProgressRecord.setTotalUnitCount(A, 1000)
InstallProgressRecord.setCompletedUnitCount(A, 1000)
SerialQueue#1.sync()
8 default transfer for asset A ended with success y error (null) existingApp:0
AppRegistry.proxyForIdentifier(A, placeholders included)
AppRegistry.installProgress(A (placeholder), 0)
InstallProgressRecord.description(A)
8 error Returning A state=1 phase=0 1000/1000 progress for A
8 default asset transfer succeeded for A
AppRegistry.finishInstallPhase(A)
8 default Received file at MEDIA/A.zip
Lock#1.lock()
FileSystem.readFile(TODO/ApplicationsSync.plist)
8 default Changing A from install to DOWNLOADED
FileSystem.writeFileAtomically(TODO/ApplicationsSync.plist)
Lock#1.unlock()
8 default Installing synced asset A
WaitGroup#1.enter()
8 default Enqueue install request for A
OperationQueue#1.add()
8 default asset transfer ended withsuccess: y
WaitGroup#1.wait()
AppRegistryObserver.applicationInstallsArePrioritized([A (placeholder)], [])
8 default Performing install for A
8 default Grabbing assertion for A
HomeScreenService.takeTerminationAssertion(A, 0)
8 default Assertion not found for A, installing anyway...
InstallTransactionLog.logScenario(Asset install, 0, yes, A, assertion not found)
AppRegistry.installPackage(MEDIA/A.zip, {PackageType = Customer; BundleIdentifier = A;})
8 default A install succeeded
Lock#1.lock()
FileSystem.readFile(TODO/ApplicationsSync.plist)
8 default Changing A from DOWNLOADED to INSTALLED
FileSystem.writeFileAtomically(TODO/ApplicationsSync.plist)
Lock#1.unlock()
Lock#2.lock()
FileSystem.readFile(AREA/RestoreState.plist)
Lock#2.unlock()
FileSystem.removeItem(MEDIA/A.zip)
8 default Finished install for A
Lock#2.lock()
FileSystem.readFile(AREA/RestoreState.plist)
Lock#2.unlock()
WaitGroup#1.leave()
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
)";

class Session : public AppsClientFixture {
  protected:
    /// A session that installs one application and removes another.
    void stageOneOfEach() {
        platform_.registry.addApplication(kB);
        stage(PropertyList::array({todoEntry(kA, "install"), todoEntry(kB, "remove")}));
        const std::string sideFiles = std::string(kStagingArea) + "/" + kA;
        platform_.addPropertyList(sideFiles + "/Info.plist",
                                  PropertyList::map({{"BundleDisplayName", "Shown"}}));
        platform_.addPropertyList(std::string(kStagingArea) + "/DeskoraIconState.plist",
                                  PropertyList::array({kA}));
    }
    void transfer(const SyncAssetPointer& asset) {
        client_->assetTransferUpdatedProgress(asset, 1.0);
        asset->path = asset->identifier + ".zip";
        platform_.files.addFile(packagePath(asset->identifier), "package");
        client_->assetTransferSucceeded(asset, true, nullptr);
    }
    /// How many assets were asked for.
    std::size_t run() {
        EXPECT_TRUE(client_->prepareForSyncWithHostAnchor("anchor 0", {}, nullptr));
        EXPECT_TRUE(client_->reconcileSync({}, "anchor 1", {}, nullptr));
        static_cast<void>(client_->installedAssets());
        const std::vector<SyncAssetPointer> assets = client_->outstandingAssetTransfers();
        for (const SyncAssetPointer& asset : assets) transfer(asset);
        client_->assetTransferEndedWithSuccess(true);
        client_->syncEndedWithSuccess(true);
        return assets.size();
    }
};

TEST_F(Session, MakesEveryCallAndWritesEveryMessageInOrder) {
    stageOneOfEach();
    EXPECT_EQ(run(), 1U);
    EXPECT_EQ(abbreviatedRecording(platform_), kWholeSession);
}

TEST_F(Session, LeavesTheDeviceInStepWithTheList) {
    stageOneOfEach();
    EXPECT_EQ(run(), 1U);
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA));
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), IsEmpty());
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_THAT(
        platform_.notifications.posts(),
        ElementsAre("com.korvu.deskora.trd.wsyncnotify=1", "com.korvu.deskora.trd.wsyncnotify=0"));
    EXPECT_THAT(platform_.homeScreen.layout(), ElementsAre(kA));
}

TEST_F(Session, AsksForNothingWhenTheListIsEmpty) {
    stageOneOfEach();
    EXPECT_EQ(run(), 1U);
    stage(PropertyList::array());
    EXPECT_EQ(run(), 0U);
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA));
}

TEST_F(Session, BeginsEveryMessageWithThePluginsIdentifier) {
    stageOneOfEach();
    EXPECT_EQ(run(), 1U);
    for (const RecordEntry& entry : platform_.recording()) {
        if (entry.kind != RecordEntry::Kind::Message) continue;
        EXPECT_EQ(entry.prefix, "com.korvu.trd.AppSync|") << entry.text;
    }
}

TEST_F(Session, InstallsAndRemovesOneIdentifierInTheSameList) {
    platform_.registry.addApplication(kA, "0.9");
    stage(PropertyList::array({todoEntry(kA, "install"), todoEntry(kA, "remove")}));
    EXPECT_EQ(run(), 1U);
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA));
}

}  // namespace
}  // namespace appsync
