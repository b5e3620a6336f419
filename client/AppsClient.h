#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "client/ItemMap.h"
#include "client/Log.h"
#include "client/SharedIdentifierSet.h"
#include "platform/AppRegistry.h"
#include "platform/FileSystem.h"
#include "platform/InstallCoordinator.h"
#include "platform/Platform.h"
#include "platform/SyncClient.h"
#include "platform/WorkQueues.h"

namespace appsync {

class AppInstallObserver;
class BackupManager;
class RestoreStateReader;
class TodoListFile;
class WantedTransfers;

/// The plug-in: the one object that the SyncHost sees, for the dataclass "Application".
///
/// One exists for each SyncHost process, for as long as the plug-in is loaded. The SyncHost calls
/// the operations of `SyncClient` in the order given there. Operations whose names begin with an
/// underscore are the plug-in's own. Those called "class operation" use no member; they are given
/// the platform.
/// The declarations stand in groups, one for each file that defines them.
class AppsClient final : public SyncClient,
                         public AppRegistryObserver,
                         public InstallCoordinatorObserver,
                         public std::enable_shared_from_this<AppsClient> {
  public:
    // client/AppsClient.cpp: the object and the entry to a session.

    /// `init`: a new client. Whether it installs directly or through coordinators is asked here,
    /// for its whole life. The references of the platform are copied; the services must outlive the
    /// client and what it has queued. Queued work keeps the client alive, so that it may end on a
    /// thread of the queues'. After `assetTransferEndedWithSuccess` no install is queued; who lets
    /// a client go earlier keeps all services until the queues have ended.
    [[nodiscard]] static std::shared_ptr<AppsClient> create(const Platform& platform);

    /// `dealloc`: warns of what is outstanding, and stops listening. Any thread, an install's too.
    ~AppsClient() override;
    AppsClient(const AppsClient&) = delete;
    AppsClient& operator=(const AppsClient&) = delete;

    /// `supportedDataclasses`
    [[nodiscard]] std::vector<std::string> supportedDataclasses() override;
    /// `currentSyncAnchor`: always the same, so that the host always reconciles in full.
    [[nodiscard]] std::string currentSyncAnchor() override;
    /// `prepareForSyncWithHostAnchor:progressCallback:error:`: always true.
    bool prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                      const SyncProgressCallback& progressCallback,
                                      ErrorOut error) override;
    /// `disabledAssetTypes`: the dataclass when neither installing nor removing is allowed.
    [[nodiscard]] std::optional<std::set<std::string>> disabledAssetTypes() override;
    /// `_appInstallationAllowed`, `_appRemovalAllowed`: false only on the policy's explicit no.
    [[nodiscard]] bool _appInstallationAllowed() const;
    [[nodiscard]] bool _appRemovalAllowed() const;
    /// `_getAndResetNumAppInstallsAttempted`: the installs attempted since this was last asked.
    std::uint32_t _getAndResetNumAppInstallsAttempted();

    // client/SyncReconciliation.cpp: taking over the host's todo list, and the end of a session.

    /// `reconcileSync:withNewAnchor:progressCallback:error:`: looks at the anchor only, for the
    /// log. True also when the todo list is missing or damaged; `error` may be set then.
    bool reconcileSync(const PropertyList& request, const std::string& newAnchor,
                       const SyncProgressCallback& progressCallback, ErrorOut error) override;
    /// `syncEndedWithSuccess:`
    void syncEndedWithSuccess(bool success) override;
    /// `_loadPlist:withError:`: class operation. The todo list or the last-sync app state, an array
    /// of anything. Nothing when it is missing or empty (not logged), damaged or no array (logged).
    [[nodiscard]] static std::optional<PropertyList> _loadPlist(const Platform& platform,
                                                                std::string_view path,
                                                                ErrorOut error);
    /// `_notifyDeskora:`: class operation. Tells the home screen that a sync is starting or done.
    static void _notifyDeskora(const Platform& platform, bool starting);
    /// `_orderTheItems:`: class operation. The items, those on the home screen first and in its
    /// order, the others after them in the order of the map. Only the others stay in the map.
    [[nodiscard]] static std::vector<PropertyList> _orderTheItems(const Platform& platform,
                                                                  ItemMap& items);

    // client/TodoList.cpp: what is to become of an application. Any thread.

    /// `_operationStateForIdentifier:`: the operation of its first entry in the todo list.
    [[nodiscard]] std::optional<std::string> _operationStateForIdentifier(
        const std::string& identifier) const;
    /// `changeAssetID:toDo:`: rewrites the operation of its first entry.
    void changeAssetID(const std::string& identifier, std::string_view toDo);

    // client/InstalledAssets.cpp, client/BackupPreparation.cpp: what the device holds.

    /// `installedAssets`
    [[nodiscard]] PropertyList installedAssets() override;
    /// `clearSyncData`
    void clearSyncData() override;
    /// `installedAssetMetrics`
    [[nodiscard]] PropertyList installedAssetMetrics() override;
    /// `korvuIDsForAssets`
    [[nodiscard]] std::set<std::string> korvuIDsForAssets() override;
    /// `accountsForAssets`: the first application of each account decides its person identifiers.
    [[nodiscard]] std::set<SyncAccountInfo> accountsForAssets() override;
    /// `prepareForBackup`: clears every application's mark of an automatic download. Metadata that
    /// had one is rewritten as XML.
    void prepareForBackup() override;

    // transfer/OutstandingTransfers.cpp: which packages to ask for.

    /// `outstandingAssetTransfers`: installs a placeholder, or prepares a coordinator, for each.
    [[nodiscard]] std::vector<SyncAssetPointer> outstandingAssetTransfers() override;

    // transfer/TransferEvents.cpp: what happens while packages arrive, and then.

    /// `assetTransfer:updatedProgress:`
    void assetTransferUpdatedProgress(const SyncAssetPointer& asset, double progress) override;
    /// `assetTransfer:succeeded:withError:`: called by the host, and by
    /// `applicationInstallsDidCancel` on the registry's thread.
    void assetTransferSucceeded(const SyncAssetPointer& asset, bool succeeded,
                                const ErrorRecord* error) override;
    /// `assetTransferEndedWithSuccess:`
    void assetTransferEndedWithSuccess(bool success) override;
    /// `applicationInstallsArePrioritized:arePaused:`: only InProgressAssetQuery needs these lists.
    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override;
    /// `applicationInstallsDidCancel:`: a cancelled restore is a transfer that failed. Only logged
    /// where installs are coordinated: there the coordinators tell of it.
    void applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) override;

    // transfer/InstallQueue.cpp: installing what has arrived.

    /// `_enqueueAssetInstall:`: queues one install. Any thread.
    void _enqueueAssetInstall(const SyncAssetPointer& asset);
    /// `_performAssetInstall:`: one attempt, on the install queue. Removes the package afterwards,
    /// unless a retry is to come.
    void _performAssetInstall(const SyncAssetPointer& asset);
    /// `assetInstallSucceeded:`
    void assetInstallSucceeded(const SyncAssetPointer& asset) override;
    /// `assetInstallFailed:withError:`
    void assetInstallFailed(const SyncAssetPointer& asset, const ErrorRecord& error) override;
    /// `_isRecoverableError:`: whether the same operation may succeed later. Never after null,
    /// which is a failure that does not say why, and never where installs are coordinated.
    [[nodiscard]] bool _isRecoverableError(const ErrorRecord* error) const;
    /// `_progressForAssetIdentifier:`: null where none is under way or installs are coordinated.
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> _progressForAssetIdentifier(
        const std::string& identifier) const;

    // transfer/RestoreState.cpp: what survives an interrupted session. Any thread.

    /// `_restoreStatePropertyForKey:identifier:version:`: nothing when it or the version is
    /// missing.
    [[nodiscard]] std::optional<PropertyList> _restoreStatePropertyForKey(
        std::string_view key, const std::string& identifier, const std::string* version) const;
    /// `_setRestoreStatePropertyValue:forKey:identifier:version:`: dropped silently without a
    /// version, or when RestoreState.plist is damaged.
    void _setRestoreStatePropertyValue(const PropertyList& value, std::string_view key,
                                       const std::string& identifier, const std::string* version);
    /// `cleanRestoreStateForIdentifier:`: forgets the application; a damaged file goes altogether.
    void cleanRestoreStateForIdentifier(const std::string& identifier);

    // coordination/Coordinators.cpp: what an install is coordinated with. Each makes one object, in
    // the plug-in's name (SyncClientID), and gives null when it cannot. Any thread.

    /// `_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier:existingApp:createIfNotExisting:error:`:
    /// that of an update (`existingApp`) or of a first install. Null, without an error, also for
    /// one that another client has created. `error` gets the service's error in any case, or
    /// nothing.
    [[nodiscard]] InstallCoordinatorPointer
    _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(const std::string& identifier,
                                                                  bool existingApp,
                                                                  bool createIfNotExisting,
                                                                  ErrorOut error);
    /// `_placeHolderForBundleIdentifier:name:installType:`: one that no coordinator has yet.
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> _placeHolderForBundleIdentifier(
        const std::string& identifier, const std::string& name, std::uint64_t installType);
    /// `_createAppAssetPromiseForBundleIdentifier:atPath:andAddToCoordinatinator:`: without a path
    /// a promise of a package that is still to come. The coordinator may be null; when it refuses
    /// the promise, that is cancelled, and `error` is set.
    std::shared_ptr<PathTransferPromise> _createAppAssetPromiseForBundleIdentifier(
        const std::string& identifier, const std::optional<std::string>& path,
        InstallCoordinator* coordinator, ErrorOut error = nullptr);
    /// `_createIconPromiseForBundleIdentifier:transferPath:diskSpaceNeeded:andAddToPlaceHolder:forAppInstall:`:
    /// a promise already kept with the file at `path`. `placeholder` and `error` are as above.
    std::shared_ptr<PathTransferPromise> _createIconPromiseForBundleIdentifier(
        const std::string& identifier, const std::string& path, std::uint64_t diskSpaceNeeded,
        InstallPlaceholder* placeholder, bool forAppInstall, ErrorOut error = nullptr);
    /// `_userDataPromiseForBundleIdentifier:`: a promise already kept, attached to nothing yet.
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> _userDataPromiseForBundleIdentifier(
        const std::string& identifier);

    // The next three groups are the `AppInstallUsingCoordination` interface.
    // coordination/CoordinatedInstall.cpp: the beginning and the undoing of an install.

    /// `prepareAppForInstallUsingCoordination:existingApp:`: sets up the application's coordinator,
    /// whose placeholder stands on the home screen until the package comes. Adds what is lacking,
    /// so it may be called again. False when the install cannot go on; the coordinator is
    /// cancelled.
    bool prepareAppForInstallUsingCoordination(const SyncAsset& asset, bool existingApp);
    /// `uninstallAppUsingCoordination:`: returns at once. The outcome is only logged.
    void uninstallAppUsingCoordination(const std::string& identifier);

    // coordination/CoordinatedProgress.cpp: the package on its way; and what the coordination
    // service tells, on threads of its own.

    /// `updateTransferProgressForApp:existingApp:`: whether the promise of the package was updated.
    bool updateTransferProgressForApp(const SyncAsset& asset, bool existingApp);
    /// `transferCompleteForApp:withError:isExistingApp:`: the package is there, its path absolute;
    /// or, with an error, it never will be, and the coordinator is cancelled.
    void transferCompleteForApp(const SyncAsset& asset, const ErrorRecord* error,
                                bool isExistingApp);
    /// `assetSyncFinishedWithStatus:outstandingItems:`: after a sync that failed, cancels the
    /// coordinators of what has not come.
    void assetSyncFinishedWithStatus(bool status, const std::set<std::string>& outstandingItems);
    /// `promiseDidBeginFulfillmentWithIdentifier:`
    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) override;
    /// `coordinatorDidInstallPlaceholder:`
    void coordinatorDidInstallPlaceholder(const InstallCoordinatorPointer& coordinator) override;
    /// `coordinatorDidCompleteSuccessfully:`: marks the todo entry as installed or failed.
    void coordinatorDidCompleteSuccessfully(const InstallCoordinatorPointer& coordinator) override;
    /// `coordinator:canceledWithReason:client:`: has the host stop the transfer, once.
    void coordinatorCanceledWithReason(const InstallCoordinatorPointer& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override;
    /// `coordinatorShouldPrioritize:`: has the host send this application before the others.
    void coordinatorShouldPrioritize(const InstallCoordinatorPointer& coordinator) override;
    /// `setupInstallCoordinatorObserver`: from the first call on the client hears of every
    /// coordinator of the plug-in's. Any thread.
    void setupInstallCoordinatorObserver();

    // coordination/CoordinatedRestore.cpp: an application that a backup brings back.

    /// `prepareAppForRestoreUsingCoordination:VessikMetadata:sinfData:iconData:demotionStatus:`:
    /// sets up the application's restoring coordinator. Adds only what that lacks. `sinfData` and
    /// `iconData` may be null; any demotion status but 0 is a demoted application's. False when it
    /// cannot be restored; the coordinator is cancelled then.
    bool prepareAppForRestoreUsingCoordination(const std::string& identifier,
                                               const Bytes& vessikMetadata, const Bytes* sinfData,
                                               const Bytes* iconData, std::uint64_t demotionStatus);
    /// `_prepareDemotedAppForRestoreWithBundleId:VessikMetadata:sinfData:iconData:demotionStatus:`
    bool _prepareDemotedAppForRestoreWithBundleId(const std::string& identifier,
                                                  const Bytes& vessikMetadata,
                                                  const Bytes* sinfData, const Bytes* iconData,
                                                  std::uint64_t demotionStatus);
    /// `_prepareNonDemotedAppForRestoreWithBundleId:VessikMetadata:sinfData:iconData:`: the app
    /// store becomes responsible for the package.
    bool _prepareNonDemotedAppForRestoreWithBundleId(const std::string& identifier,
                                                     const Bytes& vessikMetadata,
                                                     const Bytes* sinfData, const Bytes* iconData);
    /// `_placeHolderForBundleIdentifier:withVessikMetadata:sinfData:iconData:demotionStatus:`: a
    /// placeholder whose configuration is complete. `vessikMetadata` is a map. Null when it cannot
    /// be made; what there is of it is cancelled then.
    [[nodiscard]] std::shared_ptr<InstallPlaceholder>
    _placeHolderForBundleIdentifierWithVessikMetadata(const std::string& identifier,
                                                      const PropertyList& vessikMetadata,
                                                      const Bytes* sinfData, const Bytes* iconData,
                                                      std::uint64_t demotionStatus);

    // restore/PlaceholderBundles.cpp: placeholder applications.

    /// `placeholderAppPathForBundleIdentifier:`: creates nothing.
    [[nodiscard]] std::string placeholderAppPathForBundleIdentifier(
        const std::string& identifier) const;
    /// `createPlaceHolderPath:forBundleIdentifier:withAttributes:`: true also when it was there.
    bool createPlaceHolderPath(const std::string& path, const std::string& identifier,
                               const FileAttributes& attributes);
    /// `writeIconData:atPath:returningFileSize:forBundleIdentifier:withAttributes:`: whether the
    /// file was created. `iconData` may be null: then nothing is. `fileSize` (bytes) may be null;
    /// it is left alone when the size is not known.
    bool writeIconData(const Bytes* iconData, const std::string& path, std::uint64_t* fileSize,
                       const std::string& identifier, const FileAttributes& attributes);
    /// `_createPlaceHolderApplication:`: builds and installs a placeholder from what the host sent
    /// along with the asset. Failures are logged.
    void _createPlaceHolderApplication(const SyncAsset& asset);
    /// `_makeIconFromBundlePath:saveTo:`: class operation. Renders a bundle's icon into a PNG file.
    [[nodiscard]] static bool _makeIconFromBundlePath(const Platform& platform,
                                                      const std::optional<std::string>& bundlePath,
                                                      const std::string& destination);
    /// `_placeholderExistsForApplication:`: whether there is a user bundle of this identifier now.
    /// Costs the same however many there are. Always false where installs are coordinated.
    [[nodiscard]] bool _placeholderExistsForApplication(const std::string& identifier) const;
    /// `_enumeratePlaceholdersWithBlock:`: calls back once for each placeholder on the device.
    void _enumeratePlaceholdersWithBlock(const AppRegistry::ProxyCallback& callback) const;
    /// `_getSystemAppPlaceholders`: the identifiers of system applications' placeholders.
    [[nodiscard]] std::set<std::string> _getSystemAppPlaceholders() const;

    // restore/RestoreInfo.cpp: the applications that a backup brings back.

    /// `reconcileRestoreOfType:withError:`: true and no error, whatever happens.
    bool reconcileRestoreOfType(std::int64_t type, ErrorOut error) override;
    /// `_processVessikRestoreInfo`: makes a placeholder for each application of the restore
    /// information that has none, waits for those still to come, and moves the information away.
    /// The outcome of the last application handed on; false also when the information cannot be
    /// read.
    bool _processVessikRestoreInfo();
    /// `_processVessikRestoreInfoForApp:vessikMetaData:sinfData:iconData:`: builds and installs a
    /// placeholder. True also when the metadata cannot be parsed. The other data may be null.
    bool _processVessikRestoreInfoForApp(const std::string& identifier, const Bytes& vessikMetaData,
                                         const Bytes* sinfData, const Bytes* iconData);
    /// `_loadDemotedAppsPlist:withError:`: class operation. A map. Nothing when the file is missing
    /// or empty (not logged), damaged or something else (logged).
    [[nodiscard]] static std::optional<PropertyList> _loadDemotedAppsPlist(const Platform& platform,
                                                                           std::string_view path,
                                                                           ErrorOut error);

    // restore/RestoringPlaceholders.cpp: the book of the placeholders that a restore waits for. An
    // identifier is in the set exactly when the wait group holds one entry for it and the count
    // includes it. Any thread but _restoreQueue's, on which each runs synchronously.

    /// `relocantSetPlaceHolderPromiseForRestoreAppBundle:`: its placeholder is awaited from now on.
    void relocantSetPlaceHolderPromiseForRestoreAppBundle(const std::string& identifier);
    /// `relocantCancelledCoordinatorForRestoreAppBundle:`: it is no longer awaited.
    void relocantCancelledCoordinatorForRestoreAppBundle(const std::string& identifier);
    /// `tsDidInstallPlaceHolderForAppBundle:`: it has come. Ignored once the restore waits no more.
    void tsDidInstallPlaceHolderForAppBundle(const std::string& identifier);

  private:
    friend struct AppsClientTestAccess;

    explicit AppsClient(const Platform& platform);

    // client/
    void initialize();
    bool reconcile(ErrorOut error);

    // transfer/
    [[nodiscard]] SyncAssetPointer prepareAsset(const PropertyList& itemMap,
                                                const WantedTransfers& wants);
    bool prepareCoordinator(const SyncAsset& asset);
    void runInstall(const SyncAssetPointer& asset);
    void install(const SyncAssetPointer& asset);
    void scheduleRetry(const SyncAssetPointer& asset);
    void installDidFailUnrecoverably(const SyncAsset& asset, const ErrorRecord& error);

    // restore/
    void waitForRestoringPlaceholders();
    void stopAwaitingPlaceholder(const std::string& identifier);

    // In the order in which they are set up. Only the thread of the SyncHost touches a member for
    // which nothing else is said.

    std::shared_ptr<WaitGroup> _installGroup;  // guards itself; installs hold it too
    std::unique_ptr<WaitGroup> _restorePlaceHoldersWaitGroup;  // guards itself
    // Guards itself: the SyncHost's thread meets the registry's, which reports cancelled installs.
    SharedIdentifierSet _outstandingHFTTransfers;
    std::set<std::string> _kolmAppsToIgnore;
    std::set<std::string> _placeholdersForRestoringApps;     // only on _restoreQueue
    std::unique_ptr<OperationQueue> _installOperationQueue;  // guards itself
    std::unique_ptr<BackupManager> _backupManager;           // guards itself
    std::unique_ptr<SerialQueue> _accessQueue;               // guards itself
    std::unique_ptr<SerialQueue> _restoreQueue;              // guards itself
    bool _finishedWaitingForPlaceHolderInstalls = false;     // only on _restoreQueue
    // Never changes once `create` has set it; the registry may ask a little earlier.
    std::atomic<bool> _useInstallCoordinator{false};
    // Changed only on _restoreQueue; whoever waits reads it once without the queue.
    std::atomic<std::int64_t> _restoringPlaceholderCount{0};
    std::set<std::string> _updatingApps;       // only on _accessQueue
    std::set<std::string> _userCancelledApps;  // only on _accessQueue
    std::optional<std::vector<std::string>> _uninstalledApps;
    std::shared_ptr<AppInstallObserver> _appInstallObserver;  // see isAppInstallObserverSetUp_
    std::atomic<std::uint32_t> _numAppInstallsAttempted{0};

    const Platform platform_;
    const Log log_;

    // Who turns it to true makes the observer; nobody else touches that before the destructor.
    std::atomic<bool> isAppInstallObserverSetUp_{false};

    // Each held across a whole edit of its file, so that edits on several threads lose nothing; the
    // first also while the directory of the todo list is replaced. Who needs both takes them in
    // this order. Reading needs neither: the files are replaced atomically.
    std::unique_ptr<Lock> todoListLock_;
    std::unique_ptr<Lock> restoreStateLock_;
    const std::unique_ptr<TodoListFile> todoListFile_;              // under todoListLock_
    const std::unique_ptr<RestoreStateReader> restoreStateReader_;  // guards itself
};

}  // namespace appsync
