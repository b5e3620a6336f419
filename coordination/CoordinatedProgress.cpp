#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"
#include "coordination/InstallErrors.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/SyncHost.h"
#include "platform/TransferService.h"
#include "transfer/DownloadAsset.h"

namespace appsync {

namespace {

constexpr std::string_view kObserverService = "com.korvu.trd.rlink.tsappobserverdelegate";

/// The code of the error that a person sees when a package did not come.
constexpr std::int64_t kTransferFailedCode = 1;

/// The asset's path, absolute; absent while the host has not said where the file will lie.
std::optional<std::string> absolutePathOf(const SyncAsset& asset) {
    if (!asset.path || asset.path->starts_with('/')) return asset.path;
    return formatPath(kInDirectoryFormat, {kPublicStaging, *asset.path});
}

// What an observer is handed need not say which application it is about.
std::optional<std::string> identifierOf(const InstallCoordinator* coordinator) {
    return coordinator != nullptr ? coordinator->bundleIdentifier() : std::nullopt;
}
std::optional<ErrorRecord> errorOf(const InstallCoordinator* coordinator) {
    return coordinator != nullptr ? coordinator->error() : std::nullopt;
}

}  // namespace

/// The coordinator of an install that still goes on; null when there is none.
std::shared_ptr<InstallCoordinator> AppsClient::coordinatorUnderWay(const std::string& identifier,
                                                                    bool existingApp) {
    auto coordinator = _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
        identifier, existingApp, false, nullptr);
    if (coordinator == nullptr || coordinator->error()) return nullptr;
    return coordinator;
}

bool AppsClient::updateTransferProgressForApp(const SyncAsset& asset, bool existingApp) {
    const std::string& identifier = asset.identifier;
    const auto coordinator = coordinatorUnderWay(identifier, existingApp);
    if (coordinator == nullptr) return false;
    auto promise = coordinator->appAssetPromise();
    if (promise != nullptr && promise->isComplete()) {
        log_(Level::Default, "%s|Asset promise is already satisfied for %{public}@", identifier);
        return false;
    }
    if (promise == nullptr) {
        promise = _createAppAssetPromiseForBundleIdentifier(identifier, absolutePathOf(asset),
                                                            coordinator.get());
        if (promise == nullptr) return false;
    }
    log_(Level::Default, "%s|Updating download progress: %f install progress:%f for %{public}@",
         asset.downloadProgress, asset.installProgress, identifier);
    promise->setPercentComplete(asset.downloadProgress);
    return true;
}

void AppsClient::transferCompleteForApp(const SyncAsset& asset, const ErrorRecord* error,
                                        bool isExistingApp) {
    const auto coordinator = coordinatorUnderWay(asset.identifier, isExistingApp);
    if (coordinator == nullptr) return;
    if (error != nullptr) {
        cancelForFailedTransfer(*coordinator, *error);
    } else {
        keepAppAssetPromise(asset, *coordinator);
    }
}

void AppsClient::cancelForFailedTransfer(InstallCoordinator& coordinator,
                                         const ErrorRecord& error) {
    coordinator.cancelForReason(
        platform_.coordination.userPresentableError(kTransferFailedCode, error), SyncClientID);
}

void AppsClient::keepAppAssetPromise(const SyncAsset& asset, InstallCoordinator& coordinator) {
    const std::string& identifier = asset.identifier;
    auto promise = coordinator.appAssetPromise();
    if (promise != nullptr && promise->isComplete()) {
        log_(Level::Default, "%s|Asset promise is already satisfied for %{public}@", identifier);
        return;
    }
    const std::optional<std::string> path = absolutePathOf(asset);
    const auto url = FileURL::fromPath(path.value_or(""), false);
    if (!url) {
        // Nothing will ever lie at a path that no URL can hold.
        cancelForFailedTransfer(coordinator,
                                {std::string(kPosixErrorDomain), kPosixInvalidArgument, {}});
        return;
    }
    if (promise != nullptr) {
        promise->setTransferPath(*url);
    } else {
        promise = _createAppAssetPromiseForBundleIdentifier(identifier, path, &coordinator);
    }
    log_(Level::Default, "%s|Satisfying asset promise for %{public}@", identifier);
    if (promise == nullptr) return;
    promise->setPercentComplete(1.0);
    promise->setComplete();
}

void AppsClient::assetSyncFinishedWithStatus(bool status,
                                             const std::set<std::string>& outstandingItems) {
    for (const std::string& identifier : outstandingItems) {
        const auto coordinator =
            platform_.coordination.existingCoordinator(identifier, SyncClientID);
        if (coordinator == nullptr || status) continue;
        const ErrorRecord error = makeInstallError(InstallError::InstallFailed);
        log_(Level::Default, "%s|Cancelling coordinator with error %{public}@ for %{public}@",
             error, identifier);
        coordinator->cancelForReason(error, SyncClientID);
    }
}

void AppsClient::promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) {
    log_(Level::Default, "%s|promiseDidBeginFulfillmentWithIdentifier %lu", promise);
}

void AppsClient::coordinatorDidInstallPlaceholder(
    const std::shared_ptr<InstallCoordinator>& coordinator) {
    const std::optional<std::string> identifier = identifierOf(coordinator.get());
    log_(Level::Default, "%s|coordinatorDidInstallPlaceholder for %{public}@ with error %{public}@",
         identifier, errorOf(coordinator.get()));
    if (identifier) tsDidInstallPlaceHolderForAppBundle(*identifier);
}

void AppsClient::coordinatorDidCompleteSuccessfully(
    const std::shared_ptr<InstallCoordinator>& coordinator) {
    const std::optional<std::string> identifier = identifierOf(coordinator.get());
    const std::optional<ErrorRecord> error = errorOf(coordinator.get());
    log_(Level::Default,
         "%s|coordinatorDidCompleteSuccessfully for %{public}@ with error %{public}@", identifier,
         error);
    if (!identifier) return;
    changeAssetID(*identifier, error ? kTodoFailed : kTodoInstalled);
    cleanRestoreStateForIdentifier(*identifier);
}

void AppsClient::coordinatorCanceledWithReason(
    const std::shared_ptr<InstallCoordinator>& coordinator, const ErrorRecord& /*reason*/,
    CoordinationClient /*client*/) {
    const std::optional<std::string> identifier = identifierOf(coordinator.get());
    if (!identifier) return;
    bool wasCancelled = false;
    _accessQueue->sync([&] { wasCancelled = !_userCancelledApps.insert(*identifier).second; });
    TransferService* transfers = wasCancelled ? nullptr : platform_.host.transferService();
    if (transfers != nullptr && transfers->canCancelTransfers()) {
        log_(Level::Default, "%s|Cancelling asset sync for %{public}@", *identifier);
        transfers->cancelTransferForFailedAsset(*makeDownloadAsset(*identifier));
        return;
    }
    log_(Level::Error,
         "%s|Cannot cancel %{public}@ as it's already cancelled %d OR the call is not supported",
         *identifier, wasCancelled);
}

void AppsClient::coordinatorShouldPrioritize(
    const std::shared_ptr<InstallCoordinator>& coordinator) {
    const std::optional<std::string> identifier = identifierOf(coordinator.get());
    if (!identifier) return;
    log_(Level::Default, "%s|Prioritize %{public}@", *identifier);
    prioritizeTransfer(*identifier);
}

void AppsClient::prioritizeTransfer(const std::string& identifier) {
    TransferService* transfers = platform_.host.transferService();
    if (transfers == nullptr || !transfers->canPrioritizeAssets()) {
        log_(Level::Error, "%s|Cannot prioritize %{public}@ as it's not supported", identifier);
        return;
    }
    // The client may have gone when the completion comes; the platform has not.
    transfers->prioritizeAsset(
        *makeDownloadAsset(identifier), [log = log_, identifier](const ErrorRecord* error) {
            log(Level::Default, "%s|Prioritize %{public}@ finished with error %{public}@",
                identifier, error);
        });
}

void AppsClient::setupInstallCoordinatorObserver() {
    if (isAppInstallObserverSetUp_.exchange(true)) return;
    _appInstallObserver = platform_.coordination.makeAppInstallObserver(
        std::string(kObserverService), {SyncClientID}, weak_from_this());
    if (_appInstallObserver == nullptr) isAppInstallObserverSetUp_ = false;
}

}  // namespace appsync
