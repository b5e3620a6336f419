#include "transfer/TransferEnd.h"

#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/SafeIdentifier.h"
#include "client/TodoList.h"
#include "coordination/InstallErrors.h"
#include "transfer/GivenUpRestore.h"
#include "transfer/RestoreState.h"

namespace appsync {

namespace {

bool isCancellable(const InstallProgressRecord& progress) {
    return progress.installState() < kInstallStateCanceled;
}

}  // namespace

TransferEnd::TransferEnd(AppsClient& client, const Platform& platform, BackupManager& backup,
                         const std::atomic<bool>& isCoordinated, TransferEndFacts facts)
    : client_(client),
      platform_(platform),
      backup_(backup),
      isCoordinated_(isCoordinated),
      log_(platform),
      facts_(std::move(facts)),
      progress_(client._progressForAssetIdentifier(identifier())) {}

void TransferEnd::succeed() {
    const SyncAsset& asset = *facts_.asset;
    log_(Level::Default, "%s|asset transfer succeeded for %{public}@", asset.identifier);
    finishLoading();
    resolvePath();
    if (!isSafe(asset.path)) {
        log_(Level::Default, "%s|Ignoring invalid path: %{public}@", asset.path);
        return;
    }
    if (!asset.isDownload) {
        client_.changeAssetID(asset.identifier, kTodoSent);
        return;
    }
    log_(Level::Default, "%s|Received file at %{public}@", asset.path);
    client_.changeAssetID(asset.identifier, kTodoDownloaded);
    packageDidArrive();
}

void TransferEnd::finishLoading() const {
    if (progress_ == nullptr) return;
    if (isCoordinated_) {
        log_(Level::Default,
             "%s|not setting install phase finished for %{public}@ as coordination is enabled",
             identifier());
        return;
    }
    platform_.registry.finishInstallPhase(*progress_);
}

void TransferEnd::resolvePath() {
    SyncAsset& asset = *facts_.asset;
    if (asset.path) {
        asset.path = receivedFilePath(*asset.path);
        return;
    }
    const auto recorded = client_._restoreStatePropertyForKey(kRestoreStatePathKey,
                                                              asset.identifier, asset.version());
    if (recorded && recorded->isString()) asset.path = *recorded->asString();
}

void TransferEnd::packageDidArrive() {
    if (!facts_.asset->isRestore) {
        syncedPackageDidArrive();
    } else if (facts_.asset->completedParts != kAssetPartApplicationData) {
        restorePackageDidArrive();
    } else {
        restoreDataDidArrive();
    }
}

void TransferEnd::syncedPackageDidArrive() {
    log_(Level::Default, "%s|Installing synced asset %{public}@", identifier());
    if (isCoordinated_) {
        client_.transferCompleteForApp(*facts_.asset, nullptr, facts_.isExistingApp);
    } else {
        client_._enqueueAssetInstall(facts_.asset);
    }
}

void TransferEnd::restorePackageDidArrive() {
    const SyncAsset& asset = *facts_.asset;
    if (isCoordinated_) {
        log_(Level::Default,
             "%s|Not processing restore asset %{public}@ as coordination is enabled",
             asset.identifier);
        return;
    }
    if (!backup_.restoreDataExists(asset.identifier)) {
        log_(Level::Default, "%s|No restore data exists for %{public}@", asset.identifier);
        client_._enqueueAssetInstall(facts_.asset);
        return;
    }
    log_(Level::Default, "%s|Restore data exists for %{public}@", asset.identifier);
    if (progress_ != nullptr) progress_->setInstallPhase(kInstallPhaseRestoringData);
    client_._setRestoreStatePropertyValue(*asset.path, kRestoreStatePathKey, asset.identifier,
                                          asset.version());
}

void TransferEnd::restoreDataDidArrive() {
    if (isCoordinated_) {
        log_(Level::Default,
             "%s|Not processing kTRAssetPartApplicationData for restore asset %{public}@ as "
             "coordination is enabled",
             identifier());
        return;
    }
    client_._enqueueAssetInstall(facts_.asset);
}

void TransferEnd::fail(const ErrorRecord* error) {
    const bool recoverable = client_._isRecoverableError(error);
    log_(Level::Default, "%s|failed to transfer asset %{public}@. err=%{public}@, recoverable=%d",
         identifier(), error, recoverable);
    if (recoverable) {
        if (progress_ != nullptr) progress_->setInstallState(kInstallStateFailed);
        return;
    }
    if (!platform_.registry.isApplicationInstalled(identifier())) return;
    if (facts_.asset->isRestore) return;
    giveUpInstall(error);
}

void TransferEnd::giveUpInstall(const ErrorRecord* error) {
    const SyncAsset& asset = *facts_.asset;
    if (progress_ != nullptr && isCancellable(*progress_)) progress_->cancel();
    log_(Level::Default, "%s|Uninstalling placeholder %{public}@", asset.identifier);
    if (asset.isRestore) {
        giveUpRestore(backup_, isCoordinated_, log_, asset.identifier,
                      "%s|Install coordination is enabled - not calling "
                      "cancelApplicationRestoreWithBundleID for %{public}@");
    }
    if (!isCoordinated_) {
        removePlaceholder();
    } else if (!facts_.isUserCancelled) {
        // Without an error the coordinator would take the transfer for complete.
        const ErrorRecord unexplained = makeInstallError(InstallError::InstallFailed);
        client_.transferCompleteForApp(asset, error != nullptr ? error : &unexplained,
                                       facts_.isExistingApp);
    }
}

void TransferEnd::removePlaceholder() const {
    const Status uninstalled = platform_.registry.uninstallApplication(
        identifier(), PropertyList::map({{UninstallPlaceholderOnlyKey, true}}));
    log_(Level::Default, "%s|Uninstalling app using RG %{public}@ %s", identifier(),
         uninstalled ? "secceeded" : "failed");
}

}  // namespace appsync
