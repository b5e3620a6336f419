#include "client/AppsClient.h"

#include <cstddef>

#include "client/TodoListFile.h"
#include "platform/BackupService.h"
#include "platform/DevicePolicyService.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/InstallTransactionLog.h"
#include "platform/Notifications.h"
#include "platform/SyncAsset.h"
#include "platform/SyncHost.h"
#include "transfer/RestoreState.h"

namespace appsync {

namespace {

constexpr std::string_view kSyncAnchor = "NO_APP_SYNC_ANCHOR";
constexpr std::string_view kDaemonIdentifier = "com.korvu.trd";
constexpr std::string_view kLogSubsystem = "com.korvu.appinstallation";
constexpr std::string_view kLogCategory = "trd.appsync";
constexpr std::string_view kAccessQueueLabel = "com.korvu.qmx.Travend.AppSync";
constexpr std::string_view kRestoreQueueLabel = "com.korvu.qmx.Travend.AppRestore";
constexpr std::size_t kConcurrentInstalls = 10;

/// How messages name the client.
constexpr std::string_view kSelf = "<AppsClient>";

/// Called when the daemon has finished starting. The center keeps the observer meanwhile.
void startupDidComplete(void* observer) {
    if (observer == nullptr) return;
    static_cast<AppsClient*>(observer)->setupInstallCoordinatorObserver();
}

bool isInsideDaemon(SyncHost& host) { return host.mainBundleIdentifier() == kDaemonIdentifier; }

bool isAllowed(DevicePolicyService& policy, PolicyFeature feature) {
    return policy.effectiveValue(feature) != PolicyAnswer::No;
}

}  // namespace

AppsClient::AppsClient(const Platform& platform)
    : platform_(platform),
      log_(platform),
      todoListFile_(std::make_unique<TodoListFile>()),
      restoreStateReader_(std::make_unique<RestoreStateReader>()) {}

std::shared_ptr<AppsClient> AppsClient::create(const Platform& platform) {
    std::shared_ptr<AppsClient> client(new AppsClient(platform));
    client->initialize();
    return client;
}

void AppsClient::initialize() {
    _installGroup = platform_.queues.makeWaitGroup();
    _restorePlaceHoldersWaitGroup = platform_.queues.makeWaitGroup();
    _installOperationQueue = platform_.queues.makeOperationQueue();
    _installOperationQueue->setMaximumConcurrentOperations(kConcurrentInstalls);
    _backupManager = platform_.backup.makeManager();
    _accessQueue = platform_.queues.makeSerialQueue(kAccessQueueLabel);
    _restoreQueue = platform_.queues.makeSerialQueue(kRestoreQueueLabel);
    todoListLock_ = platform_.queues.makeLock();
    restoreStateLock_ = platform_.queues.makeLock();
    platform_.registry.addObserver(weak_from_this());
    platform_.transactions.initialize(*platform_.log.makeHandle(kLogSubsystem, kLogCategory));
    _finishedWaitingForPlaceHolderInstalls = false;
    _useInstallCoordinator = platform_.coordination.isCoordinationEnabled();
    _restoringPlaceholderCount = 0;
    if (!isInsideDaemon(platform_.host)) return;
    // Inside the daemon there is no earlier wait to finish.
    _finishedWaitingForPlaceHolderInstalls = true;
    platform_.notificationCenter.addObserver(weak_from_this(), kStartupCompleteNotification,
                                             startupDidComplete,
                                             NotificationCenter::SuspensionBehavior::Drop);
}

AppsClient::~AppsClient() {
    const std::size_t outstanding = _outstandingHFTTransfers.contents().size();
    if (outstanding != 0) {
        log_(Level::Error, "%s|%{public}@ getting dealloc'd with %lu outstanding HFT transfers!",
             kSelf, outstanding);
    }
    if (!_placeholdersForRestoringApps.empty()) {
        log_(Level::Error,
             "%s|%{public}@ getting dealloc'd with %{public}@pending placeholder install complete "
             "notifications",
             kSelf, listOf(_placeholdersForRestoringApps));
    }
    _outstandingHFTTransfers.clear();
    _uninstalledApps.reset();
    _installGroup.reset();
    _restorePlaceHoldersWaitGroup.reset();
    platform_.registry.removeObserver(this);
    if (!isInsideDaemon(platform_.host)) return;
    platform_.notificationCenter.removeObserver(this, kStartupCompleteNotification);
    _appInstallObserver.reset();
}

std::vector<std::string> AppsClient::supportedDataclasses() {
    return {std::string(kApplicationDataclass)};
}

std::string AppsClient::currentSyncAnchor() { return std::string(kSyncAnchor); }

bool AppsClient::prepareForSyncWithHostAnchor(const std::string& /*hostAnchor*/,
                                              const SyncProgressCallback& /*progressCallback*/,
                                              ErrorOut /*error*/) {
    _kolmAppsToIgnore.clear();
    return true;
}

std::optional<std::set<std::string>> AppsClient::disabledAssetTypes() {
    if (_appInstallationAllowed() || _appRemovalAllowed()) return std::nullopt;
    return std::set<std::string>{std::string(kApplicationDataclass)};
}

bool AppsClient::_appInstallationAllowed() const {
    return isAllowed(platform_.policy, PolicyFeature::AppInstallationAllowed);
}

bool AppsClient::_appRemovalAllowed() const {
    return isAllowed(platform_.policy, PolicyFeature::AppRemovalAllowed);
}

std::uint32_t AppsClient::_getAndResetNumAppInstallsAttempted() {
    return _numAppInstallsAttempted.exchange(0, std::memory_order_relaxed);
}

}  // namespace appsync
