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

/// Absent while the host has not said where the file will lie.
std::optional<std::string> filePathOf(const SyncAsset& asset) {
    return asset.path ? std::optional(receivedFilePath(*asset.path)) : std::nullopt;
}

// What an observer is handed need not say which application it is about.
std::optional<std::string> identifierOf(const InstallCoordinator* coordinator) {
    return coordinator != nullptr ? coordinator->bundleIdentifier() : std::nullopt;
}
std::optional<ErrorRecord> errorOf(const InstallCoordinator* coordinator) {
    return coordinator != nullptr ? coordinator->error() : std::nullopt;
}

/// The coordinator of an install that still goes on; null when there is none.
std::shared_ptr<InstallCoordinator> coordinatorUnderWay(AppsClient& client,
                                                        const std::string& identifier,
                                                        bool existingApp) {
    auto coordinator = client._initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
        identifier, existingApp, false, nullptr);
    if (coordinator == nullptr || coordinator->error()) return nullptr;
    return coordinator;
}

void cancelForFailedTransfer(const Platform& platform, InstallCoordinator& coordinator,
                             const ErrorRecord& error) {
    coordinator.cancelForReason(
        platform.coordination.userPresentableError(kTransferFailedCode, error), SyncClientID);
}

void keepAppAssetPromise(AppsClient& client, const Platform& platform, const SyncAsset& asset,
                         InstallCoordinator& coordinator) {
    const std::string& identifier = asset.identifier;
    const Log log(platform);
    auto promise = coordinator.appAssetPromise();
    if (promise != nullptr && promise->isComplete()) {
        log(Level::Default, "%s|Asset promise is already satisfied for %{public}@", identifier);
        return;
    }
    const std::optional<std::string> path = filePathOf(asset);
    const auto url = FileURL::fromPath(path.value_or(""), false);
    if (!url) {
        // Nothing will ever lie at a path that no URL can hold.
        cancelForFailedTransfer(platform, coordinator,
                                {std::string(kPosixErrorDomain), kPosixInvalidArgument, {}});
        return;
    }
    if (promise != nullptr) {
        promise->setTransferPath(*url);
    } else {
        promise = client._createAppAssetPromiseForBundleIdentifier(identifier, path, &coordinator);
    }
    log(Level::Default, "%s|Satisfying asset promise for %{public}@", identifier);
    if (promise == nullptr) return;
    promise->setPercentComplete(1.0);
    promise->setComplete();
}

void prioritizeTransfer(const Platform& platform, const std::string& identifier) {
    const Log log(platform);
    TransferService* transfers = platform.host.transferService();
    if (transfers == nullptr || !transfers->canPrioritizeAssets()) {
        log(Level::Error, "%s|Cannot prioritize %{public}@ as it's not supported", identifier);
        return;
    }
    // The client may have gone when the completion comes; the platform has not.
    transfers->prioritizeAsset(
        *makeDownloadAsset(identifier), [log, identifier](const ErrorRecord* error) {
            log(Level::Default, "%s|Prioritize %{public}@ finished with error %{public}@",
                identifier, error);
        });
}

}  // namespace

bool AppsClient::updateTransferProgressForApp(const SyncAsset& asset, bool existingApp) {
    const std::string& identifier = asset.identifier;
    const auto coordinator = coordinatorUnderWay(*this, identifier, existingApp);
    if (coordinator == nullptr) return false;
    auto promise = coordinator->appAssetPromise();
    if (promise != nullptr && promise->isComplete()) {
        log_(Level::Default, "%s|Asset promise is already satisfied for %{public}@", identifier);
        return false;
    }
    if (promise == nullptr) {
        promise = _createAppAssetPromiseForBundleIdentifier(identifier, filePathOf(asset),
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
    const auto coordinator = coordinatorUnderWay(*this, asset.identifier, isExistingApp);
    if (coordinator == nullptr) return;
    if (error != nullptr) {
        cancelForFailedTransfer(platform_, *coordinator, *error);
    } else {
        keepAppAssetPromise(*this, platform_, asset, *coordinator);
    }
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
    prioritizeTransfer(platform_, *identifier);
}

void AppsClient::setupInstallCoordinatorObserver() {
    if (isAppInstallObserverSetUp_.exchange(true)) return;
    _appInstallObserver = platform_.coordination.makeAppInstallObserver(
        std::string(kObserverService), {SyncClientID}, weak_from_this());
    if (_appInstallObserver == nullptr) isAppInstallObserverSetUp_ = false;
}

}  // namespace appsync
