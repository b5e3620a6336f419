#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"
#include "platform/BackupService.h"
#include "platform/HomeScreenService.h"
#include "platform/InstallTransactionLog.h"
#include "platform/SyncHost.h"
#include "transfer/InstallRetry.h"

namespace appsync {

namespace {

constexpr std::string_view kInstallScenario = "Asset install";
constexpr std::string_view kAssertionSucceeded = "assertion succeeded";
constexpr std::string_view kAssertionNotFound = "assertion not found";
constexpr std::string_view kAssertionDenied = "assertion denied";
constexpr std::string_view kAssertionUnknownError = "unknown error grabbing assertion";
constexpr std::string_view kRetrying = "retrying asset install";

constexpr std::string_view kRestoreScenario = "Nimbra restore";
constexpr std::string_view kFailedRecoverably = "install failed recoverably";
constexpr std::string_view kPlaceholderRemoved = "placeholder removed";
constexpr std::string_view kPlaceholderNotRemoved = "failed to remove placeholder";

constexpr std::uint64_t kAssertionReason = 0;

ErrorRecord invalidArgument() {
    return {std::string(kPosixErrorDomain), kPosixInvalidArgument, {}};
}

/// Has the registry install the asset's package. A path that no URL can hold is an invalid
/// argument, with which the installer is not called.
Status installPackage(AppRegistry& registry, const SyncAsset& asset, bool& wasCalled) {
    const auto package = FileURL::fromPath(asset.path.value_or(""), false);
    wasCalled = package.has_value();
    if (!package) return invalidArgument();
    return registry.installPackage(*package,
                                   PropertyList::map({{PackageTypeKey, PackageTypeCustomer},
                                                      {BundleIdentifierKey, asset.identifier}}));
}

}  // namespace

void AppsClient::_enqueueAssetInstall(const SyncAssetPointer& asset) {
    _installGroup->enter();
    Task install = [client = shared_from_this(), group = _installGroup, asset]() mutable {
        client->runInstall(asset);
        // First the client, then the group: who waits for the group may take the platform away
        // next.
        client.reset();
        group->leave();
    };
    log_(Level::Default, "%s|Enqueue install request for %{public}@", asset->identifier);
    _installOperationQueue->add(std::move(install));
}

void AppsClient::runInstall(const SyncAssetPointer& asset) {
    log_(Level::Default, "%s|Performing install for %{public}@", asset->identifier);
    _performAssetInstall(asset);
    log_(Level::Default, "%s|Finished install for %{public}@", asset->identifier);
    cleanRestoreStateForIdentifier(asset->identifier);
}

void AppsClient::_performAssetInstall(const SyncAssetPointer& asset) {
    log_(Level::Default, "%s|Grabbing assertion for %{public}@", asset->identifier);
    TerminationAssertionResult grabbed =
        platform_.homeScreen.takeTerminationAssertion(asset->identifier, kAssertionReason);
    if (isGranted(asset->identifier, grabbed.outcome)) {
        install(asset);
    } else if (grabbed.outcome == TerminationAssertionResult::kDenied) {
        grabbed.assertion.reset();
        scheduleRetry(asset);
        return;
    } else {
        assetInstallFailed(asset, invalidArgument());
    }
    grabbed.assertion.reset();
    if (asset->path) platform_.files.removeItem(*asset->path).ignore();
}

bool AppsClient::isGranted(const std::string& identifier, int outcome) {
    switch (outcome) {
        case TerminationAssertionResult::kNoSuchApplication:
            log_(Level::Default, "%s|Assertion not found for %{public}@, installing anyway...",
                 identifier);
            recordInstall(true, identifier, kAssertionNotFound);
            return true;
        case TerminationAssertionResult::kGranted:
            log_(Level::Default, "%s|Assertion succeeded for %{public}@", identifier);
            recordInstall(true, identifier, kAssertionSucceeded);
            return true;
        case TerminationAssertionResult::kDenied:
            log_(Level::Error, "%s|Assertion denied for %{public}@", identifier);
            recordInstall(true, identifier, kAssertionDenied);
            return false;
        default:
            log_(Level::Error, "%s|Unknown error %d getting assertion for %{public}@", outcome,
                 identifier);
            recordInstall(false, identifier, kAssertionUnknownError);
            return false;
    }
}

void AppsClient::install(const SyncAssetPointer& asset) {
    bool wasCalled = false;
    const Status installed = installPackage(platform_.registry, *asset, wasCalled);
    if (installed) {
        assetInstallSucceeded(asset);
    } else {
        assetInstallFailed(asset, installed.error());
    }
    if (wasCalled) _numAppInstallsAttempted.fetch_add(1, std::memory_order_relaxed);
}

void AppsClient::scheduleRetry(const SyncAssetPointer& asset) {
    log_(Level::Error, "%s|Will retry installation of %{public}@ in %d seconds", asset->identifier,
         kInstallRetryDelay.count());
    recordInstall(true, asset->identifier, kRetrying);
    _installGroup->enter();
    // Held weakly: a client that is let go meanwhile, although installs wait, takes them with it.
    Task retry = [weakly = weak_from_this(), asset] {
        std::shared_ptr<AppsClient> client = weakly.lock();
        if (client == nullptr) return;
        const std::shared_ptr<WaitGroup> group = client->_installGroup;
        client->reenqueue(asset);
        client.reset();
        group->leave();
    };
    platform_.queues.runAfter(kInstallRetryDelay, std::move(retry));
}

void AppsClient::reenqueue(const SyncAssetPointer& asset) {
    log_(Level::Error, "%s|Re-enqueue installation request for %{public}@", asset->identifier);
    _enqueueAssetInstall(asset);
}

void AppsClient::assetInstallSucceeded(const SyncAssetPointer& asset) {
    log_(Level::Default, "%s|%{public}@ install succeeded", asset->identifier);
    changeAssetID(asset->identifier, kTodoInstalled);
    cleanRestoreStateForIdentifier(asset->identifier);
}

void AppsClient::assetInstallFailed(const SyncAssetPointer& asset, const ErrorRecord& error) {
    const std::string& identifier = asset->identifier;
    // Asked in any case; a restore's failure is handled as recoverable whatever the answer.
    const bool recoverable = _isRecoverableError(&error);
    if (recoverable || asset->isRestore) {
        log_(Level::Default, "%s|%{public}@ install failed but was recoverable: %{public}@",
             identifier, error);
        recordRestore(false, identifier, kFailedRecoverably);
    } else {
        installDidFailUnrecoverably(*asset, error);
    }
    cleanRestoreStateForIdentifier(identifier);
}

void AppsClient::installDidFailUnrecoverably(const SyncAsset& asset, const ErrorRecord& error) {
    const std::string& identifier = asset.identifier;
    log_(Level::Default, "%s|%{public}@ install failed unrecoverably: %{public}@", identifier,
         error);
    changeAssetID(identifier, kTodoFailed);
    if (asset.isRestore) giveUpFailedRestore(identifier);
    removeFailedInstall(asset);
}

// No restore comes here today; one that did would have its restore given up.
void AppsClient::giveUpFailedRestore(const std::string& identifier) const {
    if (_useInstallCoordinator) {
        log_(Level::Default,
             "%s|not asking backup manager to cancel app restore for %{public}@ as install "
             "coordination is enabled",
             identifier);
        return;
    }
    _backupManager->cancelApplicationRestore(identifier);
}

void AppsClient::removeFailedInstall(const SyncAsset& asset) {
    if (!_useInstallCoordinator) {
        uninstallFailedInstall(asset.identifier);
    } else if (!asset.isRestore) {
        uninstallAppUsingCoordination(asset.identifier);
    } else {
        log_(Level::Default,
             "%s|not uninstalling restore asset %{public}@ as install coordination is enabled",
             asset.identifier);
    }
}

void AppsClient::uninstallFailedInstall(const std::string& identifier) {
    const Status uninstalled = platform_.registry.uninstallApplication(identifier, {});
    if (!uninstalled) log_(Level::Error, "%s|Uninstall of %{public}@ failed.", identifier);
    recordRestore(uninstalled.ok(), identifier,
                  uninstalled ? kPlaceholderRemoved : kPlaceholderNotRemoved);
}

bool AppsClient::_isRecoverableError(const ErrorRecord* error) const {
    if (_useInstallCoordinator) {
        log_(Level::Default,
             "%s|Tessarin is enabled - treating error %{public}@ as non recoverable", error);
        return false;
    }
    if (error == nullptr || !platform_.host.isRecoverableError(*error)) return false;
    return error->domain != kInstallerErrorDomain && error->domain != kRegistryErrorDomain;
}

std::shared_ptr<InstallProgressRecord> AppsClient::_progressForAssetIdentifier(
    const std::string& identifier) const {
    if (_useInstallCoordinator) {
        log_(Level::Default, "%s|Not returning XOProgress * for %{public}@ as tessarin is enabled",
             identifier);
        return nullptr;
    }
    const auto proxy =
        platform_.registry.proxyForIdentifier(identifier, AppRegistry::Placeholders::Included);
    auto progress = proxy ? platform_.registry.installProgress(*proxy, kWholeInstall) : nullptr;
    const auto description =
        progress != nullptr ? std::optional(progress->description()) : std::nullopt;
    log_(Level::Error, "%s|Returning %{public}@ progress for %{public}@", description, identifier);
    return progress;
}

std::optional<std::string> AppsClient::_operationStateForIdentifier(
    const std::string& identifier) const {
    const std::optional<PropertyList> todoList = _loadPlist(platform_, kTodoListPath, nullptr);
    if (!todoList) return std::nullopt;
    const std::optional<std::size_t> index = indexOfEntry(*todoList, identifier);
    if (!index) return std::nullopt;
    const std::string* operation = todoList->at(*index)->findString(kTodoOperationKey);
    return operation != nullptr ? std::optional(*operation) : std::nullopt;
}

void AppsClient::recordInstall(bool success, const std::string& identifier,
                               std::string_view description) {
    platform_.transactions.logScenario(kInstallScenario, 0, success, identifier, description);
}

void AppsClient::recordRestore(bool success, const std::string& identifier,
                               std::string_view description) {
    platform_.transactions.logScenario(kRestoreScenario, 0, success, identifier, description);
}

}  // namespace appsync
