#include <utility>

#include "client/AppsClient.h"
#include "client/TodoList.h"
#include "platform/HomeScreenService.h"
#include "platform/InstallTransactionLog.h"
#include "platform/SyncHost.h"
#include "transfer/GivenUpRestore.h"
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

void recordInstall(const Platform& platform, bool success, const std::string& identifier,
                   std::string_view description) {
    platform.transactions.logScenario(kInstallScenario, 0, success, identifier, description);
}

void recordRestore(const Platform& platform, bool success, const std::string& identifier,
                   std::string_view description) {
    platform.transactions.logScenario(kRestoreScenario, 0, success, identifier, description);
}

enum class AfterAssertion { Install, Retry, GiveUp };

/// What follows from the home screen's answer, which is logged and recorded.
AfterAssertion noteAssertion(const Platform& platform, const std::string& identifier, int outcome) {
    const Log log(platform);
    switch (outcome) {
        case TerminationAssertionResult::kNoSuchApplication:
            log(Level::Default, "%s|Assertion not found for %{public}@, installing anyway...",
                identifier);
            recordInstall(platform, true, identifier, kAssertionNotFound);
            return AfterAssertion::Install;
        case TerminationAssertionResult::kGranted:
            log(Level::Default, "%s|Assertion succeeded for %{public}@", identifier);
            recordInstall(platform, true, identifier, kAssertionSucceeded);
            return AfterAssertion::Install;
        case TerminationAssertionResult::kDenied:
            log(Level::Error, "%s|Assertion denied for %{public}@", identifier);
            recordInstall(platform, true, identifier, kAssertionDenied);
            return AfterAssertion::Retry;
        default:
            log(Level::Error, "%s|Unknown error %d getting assertion for %{public}@", outcome,
                identifier);
            recordInstall(platform, false, identifier, kAssertionUnknownError);
            return AfterAssertion::GiveUp;
    }
}

void uninstallFailedInstall(const Platform& platform, const std::string& identifier) {
    const Status uninstalled = platform.registry.uninstallApplication(identifier, {});
    if (!uninstalled) {
        const Log log(platform);
        log(Level::Error, "%s|Uninstall of %{public}@ failed.", identifier);
    }
    recordRestore(platform, uninstalled.ok(), identifier,
                  uninstalled ? kPlaceholderRemoved : kPlaceholderNotRemoved);
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
    switch (noteAssertion(platform_, asset->identifier, grabbed.outcome)) {
        case AfterAssertion::Install:
            install(asset);
            break;
        case AfterAssertion::Retry:
            grabbed.assertion.reset();
            scheduleRetry(asset);
            return;
        case AfterAssertion::GiveUp:
            assetInstallFailed(asset, invalidArgument());
    }
    grabbed.assertion.reset();
    if (asset->path) platform_.files.removeItem(*asset->path).ignore();
}

void AppsClient::install(const SyncAssetPointer& asset) {
    const auto package = FileURL::fromPath(asset->path.value_or(""), false);
    if (!package) {
        // With a path that no URL can hold the installer is not called.
        assetInstallFailed(asset, invalidArgument());
        return;
    }
    const Status installed = platform_.registry.installPackage(
        *package, PropertyList::map({{PackageTypeKey, PackageTypeCustomer},
                                     {BundleIdentifierKey, asset->identifier}}));
    if (installed) {
        assetInstallSucceeded(asset);
    } else {
        assetInstallFailed(asset, installed.error());
    }
    _numAppInstallsAttempted.fetch_add(1, std::memory_order_relaxed);
}

void AppsClient::scheduleRetry(const SyncAssetPointer& asset) {
    log_(Level::Error, "%s|Will retry installation of %{public}@ in %d seconds", asset->identifier,
         kInstallRetryDelay.count());
    recordInstall(platform_, true, asset->identifier, kRetrying);
    _installGroup->enter();
    // Held weakly: a client that is let go meanwhile, although installs wait, takes them with it.
    Task retry = [weakly = weak_from_this(), asset] {
        std::shared_ptr<AppsClient> client = weakly.lock();
        if (client == nullptr) return;
        const std::shared_ptr<WaitGroup> group = client->_installGroup;
        client->log_(Level::Error, "%s|Re-enqueue installation request for %{public}@",
                     asset->identifier);
        client->_enqueueAssetInstall(asset);
        client.reset();
        group->leave();
    };
    platform_.queues.runAfter(kInstallRetryDelay, std::move(retry));
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
        recordRestore(platform_, false, identifier, kFailedRecoverably);
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
    if (asset.isRestore) {
        giveUpRestore(*_backupManager, _useInstallCoordinator, log_, identifier,
                      "%s|not asking backup manager to cancel app restore for %{public}@ as "
                      "install coordination is enabled");
    }
    if (!_useInstallCoordinator) {
        uninstallFailedInstall(platform_, identifier);
    } else if (!asset.isRestore) {
        uninstallAppUsingCoordination(identifier);
    } else {
        log_(Level::Default,
             "%s|not uninstalling restore asset %{public}@ as install coordination is enabled",
             identifier);
    }
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

}  // namespace appsync
