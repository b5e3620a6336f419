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
#include "platform/Platform.h"
#include "platform/SyncClient.h"
#include "platform/WorkQueues.h"

namespace appsync {

class AppInstallObserver;
class BackupManager;
class RestoreState;
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
                         public std::enable_shared_from_this<AppsClient> {
  public:
    // client/AppsClient.cpp: the object and the entry to a session.

    /// `init`: a new client. Null, and an error that says why, on a device whose installs are
    /// coordinated: this plug-in installs directly only. The platform must outlive the client and
    /// what it has queued.
    [[nodiscard]] static std::shared_ptr<AppsClient> create(const Platform& platform,
                                                            ErrorOut error = nullptr);

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

    /// `outstandingAssetTransfers`: installs a placeholder for each application that it asks for.
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
    /// `applicationInstallsDidCancel:`: a cancelled restore is a transfer that failed.
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
    /// what failed without saying why is not recoverable.
    [[nodiscard]] bool _isRecoverableError(const ErrorRecord* error) const;
    /// `_progressForAssetIdentifier:`: null when no install is under way for it.
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
    [[nodiscard]] SyncAssetPointer makeAsset(const TransferItem& item,
                                             const RestoreState& restoreState) const;
    [[nodiscard]] unsigned assetPartsFor(const TransferItem& item,
                                         const RestoreState& restoreState) const;

    // transfer/TransferEvents.cpp
    void transferDidSucceed(const SyncAssetPointer& asset, InstallProgressRecord* progress);
    void resolvePath(SyncAsset& asset) const;
    void packageDidArrive(const SyncAssetPointer& asset, InstallProgressRecord* progress);
    void restorePackageDidArrive(const SyncAssetPointer& asset, InstallProgressRecord* progress);
    void transferDidFail(const SyncAsset& asset, const ErrorRecord* error,
                         InstallProgressRecord* progress);
    void removePlaceholder(const SyncAsset& asset, InstallProgressRecord* progress);
    void closeOutstandingTransfers(const std::set<std::string>& outstanding, bool success);

    // transfer/InstallQueue.cpp
    bool isGranted(const std::string& identifier, int outcome);
    void runInstall(const SyncAssetPointer& asset);
    void install(const SyncAssetPointer& asset);
    void scheduleRetry(const SyncAssetPointer& asset);
    void reenqueue(const SyncAssetPointer& asset);
    void installDidFailUnrecoverably(const SyncAsset& asset, const ErrorRecord& error);
    void recordInstall(bool success, const std::string& identifier, std::string_view description);
    void recordRestore(bool success, const std::string& identifier, std::string_view description);

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
    std::set<std::string> _placeholdersForRestoringApps;      // only on _restoreQueue
    std::unique_ptr<OperationQueue> _installOperationQueue;   // guards itself
    std::unique_ptr<BackupManager> _backupManager;            // guards itself
    std::unique_ptr<SerialQueue> _accessQueue;                // guards itself
    std::unique_ptr<SerialQueue> _restoreQueue;               // guards itself
    bool _finishedWaitingForPlaceHolderInstalls = false;      // only on _restoreQueue
    bool _useInstallCoordinator = false;                      // never changes once set
    std::atomic<std::int64_t> _restoringPlaceholderCount{0};  // changed only on _restoreQueue
    std::set<std::string> _updatingApps;                      // only on _accessQueue
    std::set<std::string> _userCancelledApps;                 // only on _accessQueue
    std::optional<std::vector<std::string>> _uninstalledApps;
    std::shared_ptr<AppInstallObserver> _appInstallObserver;
    std::atomic<std::uint32_t> _numAppInstallsAttempted{0};

    const Platform platform_;
    const Log log_;

    // Each held across a whole edit of its file (read, change, write), so that edits on several
    // threads lose nothing; the first also while the directory of the todo list is replaced. Who
    // needs both takes them in this order. Reading needs neither: the files are replaced
    // atomically.
    std::unique_ptr<Lock> todoListLock_;
    std::unique_ptr<Lock> restoreStateLock_;
};

}  // namespace appsync
