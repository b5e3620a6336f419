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
class RestoreState;
enum class CoordinatorKind;
struct RestoredApp;
struct TransferItem;

/// The plug-in: the one object that the SyncHost sees, for the dataclass "Application".
///
/// One exists for each SyncHost process, for as long as the plug-in is loaded. The SyncHost calls
/// the operations of `SyncClient` in the order given there. Operations whose names begin with an
/// underscore are the plug-in's own. Those called "class operation" use no member; they are given
/// the platform.
///
/// The declarations stand in groups, one for each file that defines them.
class AppsClient final : public SyncClient,
                         public AppRegistryObserver,
                         public InstallCoordinatorObserver,
                         public std::enable_shared_from_this<AppsClient> {
  public:
    // client/AppsClient.cpp: the object and the entry to a session.

    /// `init`: a new client. Whether it installs directly or through coordinators is asked here,
    /// for its whole life. The platform must outlive the client and what it has queued.
    [[nodiscard]] static std::shared_ptr<AppsClient> create(const Platform& platform);

    /// `dealloc`: warns of what is still outstanding, and stops listening. Runs on whatever thread
    /// lets the client go, an install's for instance.
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

    /// `_appInstallationAllowed`: false only on the policy service's explicit no.
    [[nodiscard]] bool _appInstallationAllowed() const;
    /// `_appRemovalAllowed`: false only on the policy service's explicit no.
    [[nodiscard]] bool _appRemovalAllowed() const;
    /// `_getAndResetNumAppInstallsAttempted`: the installs attempted since this was last asked.
    std::uint32_t _getAndResetNumAppInstallsAttempted();

    // client/SyncReconciliation.cpp: taking over the host's todo list, and the end of a session.

    /// `reconcileSync:withNewAnchor:progressCallback:error:`: only the anchor is looked at, and
    /// only for the log. True also when the todo list is missing or damaged; `error` may be set
    /// then.
    bool reconcileSync(const PropertyList& request, const std::string& newAnchor,
                       const SyncProgressCallback& progressCallback, ErrorOut error) override;
    /// `syncEndedWithSuccess:`
    void syncEndedWithSuccess(bool success) override;

    /// `_loadPlist:withError:`: class operation. A list, the todo list or the last-sync app state;
    /// an array whose elements are of any kind. Nothing when the file is missing or empty (not
    /// logged), damaged or something else (logged).
    [[nodiscard]] static std::optional<PropertyList> _loadPlist(const Platform& platform,
                                                                std::string_view path,
                                                                ErrorOut error);
    /// `_notifyDeskora:`: class operation. Tells the home screen that a sync is starting or done.
    static void _notifyDeskora(const Platform& platform, bool starting);
    /// `_orderTheItems:`: class operation. The items, those on the home screen first and in its
    /// order, the others after them in the order of the map. The map is empty afterwards.
    [[nodiscard]] static std::vector<PropertyList> _orderTheItems(const Platform& platform,
                                                                  ItemMap& items);

    // client/InstalledAssets.cpp: what the device holds.

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

    // client/BackupPreparation.cpp

    /// `prepareForBackup`: clears every application's mark of an automatic download. Metadata that
    /// had one is rewritten as XML.
    void prepareForBackup() override;

    // transfer/OutstandingTransfers.cpp: which packages to ask for.

    /// `outstandingAssetTransfers`: installs a placeholder for each application that it asks for,
    /// or prepares its coordinator.
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
    /// `_isRecoverableError:`: whether the same operation may succeed later. `error` may be null:
    /// what failed without saying why is not recoverable. Nor is anything where installs are
    /// coordinated.
    [[nodiscard]] bool _isRecoverableError(const ErrorRecord* error) const;
    /// `_progressForAssetIdentifier:`: null when no install is under way for it, and where installs
    /// are coordinated.
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> _progressForAssetIdentifier(
        const std::string& identifier) const;
    /// `_operationStateForIdentifier:`: the operation of its first entry in the todo list.
    [[nodiscard]] std::optional<std::string> _operationStateForIdentifier(
        const std::string& identifier) const;

    // transfer/RestoreState.cpp: what survives an interrupted session. Any thread.

    /// `_restoreStatePropertyForKey:identifier:version:`: nothing when it, or the version, is
    /// missing.
    [[nodiscard]] std::optional<PropertyList> _restoreStatePropertyForKey(
        std::string_view key, const std::string& identifier, const std::string* version) const;
    /// `_setRestoreStatePropertyValue:forKey:identifier:version:`: dropped silently without a
    /// version, or when RestoreState.plist is damaged.
    void _setRestoreStatePropertyValue(const PropertyList& value, std::string_view key,
                                       const std::string& identifier, const std::string* version);
    /// `cleanRestoreStateForIdentifier:`: forgets the application; a damaged file goes altogether.
    void cleanRestoreStateForIdentifier(const std::string& identifier);
    /// `changeAssetID:toDo:`: rewrites the operation of the first entry with the identifier.
    void changeAssetID(const std::string& identifier, std::string_view toDo);

    // coordination/Coordinators.cpp: what an install is coordinated with. Each makes one object, in
    // the plug-in's name (SyncClientID), and gives null when it cannot. Any thread.

    /// `_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier:existingApp:createIfNotExisting:error:`:
    /// the coordinator of an update (`existingApp`) or of a first install. Null, without an error,
    /// also for one that another client has created. `error` gets the service's answer in any case:
    /// its error, or nothing.
    [[nodiscard]] std::shared_ptr<InstallCoordinator>
    _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(const std::string& identifier,
                                                                  bool existingApp,
                                                                  bool createIfNotExisting,
                                                                  ErrorOut error);
    /// `_placeHolderForBundleIdentifier:name:installType:`: one that no coordinator has yet.
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> _placeHolderForBundleIdentifier(
        const std::string& identifier, const std::string& name, std::uint64_t installType);
    /// `_createAppAssetPromiseForBundleIdentifier:atPath:andAddToCoordinatinator:`: without a path
    /// a promise of a package that is still to come. `coordinator` may be null. `error` is set when
    /// the coordinator refuses the promise; that is then cancelled.
    std::shared_ptr<PathTransferPromise> _createAppAssetPromiseForBundleIdentifier(
        const std::string& identifier, const std::optional<std::string>& path,
        InstallCoordinator* coordinator, ErrorOut error = nullptr);
    /// `_createIconPromiseForBundleIdentifier:transferPath:diskSpaceNeeded:andAddToPlaceHolder:forAppInstall:`:
    /// a promise already kept with the file at `path`. `placeholder` may be null. `error` is set
    /// when the placeholder refuses the promise; that is then cancelled.
    std::shared_ptr<PathTransferPromise> _createIconPromiseForBundleIdentifier(
        const std::string& identifier, const std::string& path, std::uint64_t diskSpaceNeeded,
        InstallPlaceholder* placeholder, bool forAppInstall, ErrorOut error = nullptr);
    /// `_userDataPromiseForBundleIdentifier:`: a promise already kept, attached to nothing yet.
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> _userDataPromiseForBundleIdentifier(
        const std::string& identifier);

    // coordination/CoordinatedInstall.cpp: `AppInstallUsingCoordination`, the beginning and the
    // undoing of an install.

    /// `prepareAppForInstallUsingCoordination:existingApp:`: sets up the application's coordinator,
    /// whose placeholder then stands on the home screen until the package comes. Adds only what the
    /// coordinator lacks, so that it may be called again. False when the install cannot go on; the
    /// coordinator is cancelled then.
    bool prepareAppForInstallUsingCoordination(const SyncAsset& asset, bool existingApp);
    /// `uninstallAppUsingCoordination:`: returns at once. The outcome is only logged.
    void uninstallAppUsingCoordination(const std::string& identifier);

    // coordination/CoordinatedProgress.cpp: `AppInstallUsingCoordination`, the package on its way;
    // and what the coordination service tells, on threads of its own.

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
    void coordinatorDidInstallPlaceholder(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;
    /// `coordinatorDidCompleteSuccessfully:`: marks the todo entry as installed or failed.
    void coordinatorDidCompleteSuccessfully(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;
    /// `coordinator:canceledWithReason:client:`: has the host stop the transfer, once.
    void coordinatorCanceledWithReason(const std::shared_ptr<InstallCoordinator>& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override;
    /// `coordinatorShouldPrioritize:`: has the host send this application before the others.
    void coordinatorShouldPrioritize(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;

    /// `setupInstallCoordinatorObserver`: from the first call on the client hears of every
    /// coordinator of the plug-in's. Any thread.
    void setupInstallCoordinatorObserver();

    // coordination/CoordinatedRestore.cpp: `AppInstallUsingCoordination`, an application that a
    // backup brings back.

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
    /// `createPlaceHolderPath:forBundleIdentifier:withAttributes:`: true also when it exists
    /// already.
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
    /// `_makeIconFromBundlePath:saveTo:`: class operation. Renders a bundle's home-screen icon into
    /// a PNG file.
    [[nodiscard]] static bool _makeIconFromBundlePath(const Platform& platform,
                                                      const std::optional<std::string>& bundlePath,
                                                      const std::string& destination);
    /// `_placeholderExistsForApplication:`: whether the registry has a bundle of this identifier.
    [[nodiscard]] bool _placeholderExistsForApplication(const std::string& identifier) const;
    /// `_enumeratePlaceholdersWithBlock:`: calls back once for each placeholder on the device.
    void _enumeratePlaceholdersWithBlock(const AppRegistry::ProxyCallback& callback) const;
    /// `_getSystemAppPlaceholders`: the identifiers of system applications' placeholders.
    [[nodiscard]] std::set<std::string> _getSystemAppPlaceholders() const;

    // restore/RestoreInfo.cpp: the applications that a backup brings back.

    /// `reconcileRestoreOfType:withError:`: true and no error, whatever happens.
    bool reconcileRestoreOfType(std::int64_t type, ErrorOut error) override;
    /// `_processVessikRestoreInfo`: makes a placeholder for each application of the restore
    /// information that has none, waits for those that are still to come, and moves the information
    /// away. The outcome of the last application that was handed on; false also when the
    /// information cannot be read.
    bool _processVessikRestoreInfo();
    /// `_processVessikRestoreInfoForApp:vessikMetaData:sinfData:iconData:`: builds and installs a
    /// placeholder. `sinfData` and `iconData` may be null. True also when the metadata cannot be
    /// parsed.
    bool _processVessikRestoreInfoForApp(const std::string& identifier, const Bytes& vessikMetaData,
                                         const Bytes* sinfData, const Bytes* iconData);
    /// `_loadDemotedAppsPlist:withError:`: class operation. A map. Nothing when the file is missing
    /// or empty (not logged), damaged or something else (logged).
    [[nodiscard]] static std::optional<PropertyList> _loadDemotedAppsPlist(const Platform& platform,
                                                                           std::string_view path,
                                                                           ErrorOut error);

    // restore/RestoringPlaceholders.cpp: the book of the placeholders that a restore waits for. An
    // identifier is in the set exactly when the wait group holds one entry for it and the count
    // includes it. Any thread; each runs synchronously on _restoreQueue, so never call one from
    // there.

    /// `relocantSetPlaceHolderPromiseForRestoreAppBundle:`: its placeholder is awaited from now on.
    void relocantSetPlaceHolderPromiseForRestoreAppBundle(const std::string& identifier);
    /// `relocantCancelledCoordinatorForRestoreAppBundle:`: it is no longer awaited.
    void relocantCancelledCoordinatorForRestoreAppBundle(const std::string& identifier);
    /// `tsDidInstallPlaceHolderForAppBundle:`: it has come. Changes nothing once the restore has
    /// stopped waiting.
    void tsDidInstallPlaceHolderForAppBundle(const std::string& identifier);

  private:
    friend struct AppsClientTestAccess;

    explicit AppsClient(const Platform& platform);

    // client/AppsClient.cpp
    void initialize();
    void makeQueues();
    void listenForStartup();
    [[nodiscard]] bool isInsideDaemon() const;

    // client/SyncReconciliation.cpp
    enum class Takeover { Failed, NothingToDo, Done };
    bool reconcile(ErrorOut error);
    Takeover takeOverStagingArea(ErrorOut error);
    void performDeletions(const PropertyList& todoList);
    void deleteApplication(const std::string& identifier);
    void clearUninstalledApps();

    // client/InstalledAssets.cpp
    [[nodiscard]] std::optional<std::vector<std::string>> lookUpUninstalled();
    void uninstallEveryPlaceholder();

    // transfer/OutstandingTransfers.cpp
    struct Wants;
    [[nodiscard]] Wants gatherWants() const;
    void gatherPlaceholders(Wants& wants) const;
    void gatherTodoEntries(Wants& wants, const PropertyList& todoList) const;
    void gatherTodoEntry(Wants& wants, const PropertyList& entry) const;
    void leaveOutInProgress(Wants& wants) const;
    void emptyIconDirectory() const;
    [[nodiscard]] SyncAssetPointer prepareAsset(const PropertyList& itemMap, const Wants& wants,
                                                const RestoreState& restoreState);
    [[nodiscard]] bool isSkipped(const TransferItem& item, const Wants& wants) const;
    [[nodiscard]] bool isSkippedRestore(const TransferItem& item) const;
    [[nodiscard]] bool isSkippedSystemApp(const TransferItem& item, const Wants& wants) const;
    [[nodiscard]] bool isSkippedDemotedApp(const TransferItem& item, const Wants& wants) const;
    [[nodiscard]] SyncAssetPointer makeAsset(const TransferItem& item,
                                             const RestoreState& restoreState) const;
    [[nodiscard]] unsigned assetPartsFor(const TransferItem& item,
                                         const RestoreState& restoreState) const;
    bool createMissingPlaceholder(const SyncAsset& asset, const Wants& wants);
    bool prepareCoordinator(const SyncAsset& asset);
    [[nodiscard]] bool isExistingApp(const std::string& identifier) const;

    // transfer/TransferEvents.cpp
    struct TransferEnd;
    void updateProgressRecord(const std::string& identifier, double fraction) const;
    void transferDidSucceed(const TransferEnd& end);
    void finishLoading(const TransferEnd& end) const;
    void resolvePath(SyncAsset& asset) const;
    void packageDidArrive(const TransferEnd& end);
    void syncedPackageDidArrive(const TransferEnd& end);
    void restorePackageDidArrive(const TransferEnd& end);
    void restoreDataDidArrive(const TransferEnd& end);
    void transferDidFail(const TransferEnd& end, const ErrorRecord* error);
    void giveUpInstall(const TransferEnd& end, const ErrorRecord* error);
    void giveUpRestore(const std::string& identifier) const;
    void removePlaceholder(const std::string& identifier) const;
    void closeOutstandingTransfers(const std::set<std::string>& outstanding, bool success);

    // transfer/InstallQueue.cpp
    bool isGranted(const std::string& identifier, int outcome);
    void runInstall(const SyncAssetPointer& asset);
    void install(const SyncAssetPointer& asset);
    void scheduleRetry(const SyncAssetPointer& asset);
    void reenqueue(const SyncAssetPointer& asset);
    void installDidFailUnrecoverably(const SyncAsset& asset, const ErrorRecord& error);
    void giveUpFailedRestore(const std::string& identifier) const;
    void removeFailedInstall(const SyncAsset& asset);
    void uninstallFailedInstall(const std::string& identifier);
    void recordInstall(bool success, const std::string& identifier, std::string_view description);
    void recordRestore(bool success, const std::string& identifier, std::string_view description);

    // coordination/CoordinatedInstall.cpp
    struct Preparation;
    bool prepare(Preparation& preparation);
    bool addInstallOptions(Preparation& preparation);
    bool addODRAssetPromises(Preparation& preparation);
    bool addAppAssetPromise(Preparation& preparation);
    bool addPlaceholderPromise(Preparation& preparation);
    void makePlaceholder(Preparation& preparation);
    void configurePlaceholder(Preparation& preparation);
    [[nodiscard]] std::uint64_t copyIconForPlaceholder(Preparation& preparation,
                                                       const std::string& iconPath);
    bool addIconPromise(Preparation& preparation, const std::string& iconPath, std::uint64_t size);
    bool setPlaceholderAttributes(Preparation& preparation);
    bool setPlaceholderMetadata(Preparation& preparation);
    void setPlaceholderComplete(Preparation& preparation);
    void cancelPreparation(const Preparation& preparation);

    // coordination/CoordinatedProgress.cpp
    [[nodiscard]] std::shared_ptr<InstallCoordinator> coordinatorUnderWay(
        const std::string& identifier, bool existingApp);
    void cancelForFailedTransfer(InstallCoordinator& coordinator, const ErrorRecord& error);
    void keepAppAssetPromise(const SyncAsset& asset, InstallCoordinator& coordinator);
    void prioritizeTransfer(const std::string& identifier);

    // restore/RestoringPlaceholders.cpp
    void stopAwaitingPlaceholder(const std::string& identifier);

    // restore/PlaceholderBundles.cpp
    void willCreatePlaceholder(const std::string& identifier, const PropertyList& info) const;
    bool installPlaceholder(const std::string& directory, const PropertyList& info,
                            const PropertyList& options);
    void didFindPlaceholder(const std::string& identifier) const;
    void copyIcon(const SyncAsset& asset, const std::string& directory) const;

    // restore/RestoreInfo.cpp
    struct RestoreFacts;
    [[nodiscard]] std::optional<PropertyList> readRestoreInfo() const;
    bool restoreApps(const PropertyList& restoreInfo);
    [[nodiscard]] RestoreFacts gatherRestoreFacts() const;
    std::optional<bool> restoreApp(const std::string& identifier, const PropertyList& info,
                                   const RestoreFacts& facts);
    void waitForRestoringPlaceholders();
    void putRestoreInfoAway() const;
    [[nodiscard]] Result<PropertyList> parseVessikMetadata(const std::string& identifier,
                                                           const Bytes& data,
                                                           Level failureLevel) const;
    bool installRestorePlaceholder(const RestoredApp& app, const PropertyList& metadata);
    bool writeRestorePlaceholderInfo(const std::string& directory, const std::string& identifier,
                                     const PropertyList& info);
    void recordAppRestore(bool success, const std::string& identifier,
                          std::string_view description);

    // coordination/CoordinatedRestore.cpp
    struct CoordinatedRestore;
    bool beginRestore(CoordinatedRestore& restore, CoordinatorKind kind);
    [[nodiscard]] bool isLeftToAppStore(const CoordinatedRestore& restore) const;
    bool addRestorePromises(CoordinatedRestore& restore);
    bool addUserDataPromise(CoordinatedRestore& restore);
    bool addRestorePlaceholder(CoordinatedRestore& restore);
    bool leaveToAppStore(CoordinatedRestore& restore);
    void giveRestoreUp(const CoordinatedRestore& restore);
    bool addRestoreIcon(const std::string& identifier, const std::string& path, std::uint64_t size,
                        InstallPlaceholder& placeholder);

    // In the order in which they are set up. Only the thread of the SyncHost touches a member for
    // which nothing else is said.

    std::shared_ptr<WaitGroup> _installGroup;  // guards itself; installs hold it too
    std::unique_ptr<WaitGroup> _restorePlaceHoldersWaitGroup;  // guards itself
    // The SyncHost's thread meets the registry's here, which reports cancelled installs: the set
    // guards itself, with a mutex that is never held across a call of the platform.
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
    // Changed only on _restoreQueue; who waits for it to fall reads it once without the queue.
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

    // Each held across a whole edit of its file (read, change, write), so that edits on several
    // threads lose nothing; the first also while the directory of the todo list is replaced. Who
    // needs both takes them in this order. Reading needs neither: the files are replaced
    // atomically.
    std::unique_ptr<Lock> todoListLock_;
    std::unique_ptr<Lock> restoreStateLock_;
};

}  // namespace appsync
