#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/SafeIdentifier.h"
#include "client/TodoList.h"
#include "platform/BackupService.h"
#include "transfer/InstallNames.h"
#include "transfer/RestoreState.h"

namespace appsync {

namespace {

constexpr std::string_view kDataclass = "Application";
constexpr std::int64_t kTotalUnits = 1000;

/// The code, in `kSyncErrorDomain`, of a transfer whose install was cancelled on the device.
constexpr std::int64_t kInstallCancelled = 2;

/// The fraction in thousandths, truncated toward zero. What is no number is none.
std::int64_t thousandths(double fraction) {
    constexpr double most = 1e15;
    const double scaled = fraction * static_cast<double>(kTotalUnits);
    if (std::isnan(scaled)) return 0;
    return static_cast<std::int64_t>(std::clamp(scaled, -most, most));
}

/// The asset as the host knows it by its application alone.
SyncAssetPointer downloadAsset(const std::string& identifier) {
    auto asset = std::make_shared<SyncAsset>();
    asset->identifier = identifier;
    asset->dataclass = kDataclass;
    asset->isDownload = true;
    return asset;
}

bool isCancellable(const InstallProgressRecord& progress) {
    return progress.installState() < kInstallStateCanceled;
}

}  // namespace

void AppsClient::assetTransferUpdatedProgress(const SyncAssetPointer& asset, double progress) {
    const std::string& identifier = asset->identifier;
    log_(Level::Default, "%s|finished transferring %lf for %{public}@", progress, identifier);
    const std::int64_t completed = thousandths(progress);
    if (const auto record = _progressForAssetIdentifier(identifier)) {
        record->setInstallState(kInstallStateActive);
        if (record->totalUnitCount() != kTotalUnits) record->setTotalUnitCount(kTotalUnits);
        record->setCompletedUnitCount(completed);
    }
    _outstandingHFTTransfers.insert(identifier);
}

void AppsClient::assetTransferSucceeded(const SyncAssetPointer& asset, bool succeeded,
                                        const ErrorRecord* error) {
    const std::string& identifier = asset->identifier;
    bool isExistingApp = false;
    _accessQueue->sync([&] {
        isExistingApp = _updatingApps.erase(identifier) != 0;
        _userCancelledApps.erase(identifier);
    });
    _outstandingHFTTransfers.erase(identifier);
    log_(Level::Default,
         "%s|transfer for asset %{public}@ ended with success %c error %{public}@ existingApp:%d",
         identifier, yesOrNo(succeeded), error, isExistingApp);
    const auto progress = _progressForAssetIdentifier(identifier);
    if (succeeded) {
        transferDidSucceed(asset, progress.get());
    } else {
        transferDidFail(*asset, error, progress.get());
    }
}

void AppsClient::transferDidSucceed(const SyncAssetPointer& asset,
                                    InstallProgressRecord* progress) {
    const std::string& identifier = asset->identifier;
    log_(Level::Default, "%s|asset transfer succeeded for %{public}@", identifier);
    if (progress != nullptr) platform_.registry.finishInstallPhase(*progress);
    resolvePath(*asset);
    if (!isSafe(asset->path)) {
        log_(Level::Default, "%s|Ignoring invalid path: %{public}@", asset->path);
        return;
    }
    if (!asset->isDownload) {
        changeAssetID(identifier, kTodoSent);
        return;
    }
    log_(Level::Default, "%s|Received file at %{public}@", asset->path);
    changeAssetID(identifier, kTodoDownloaded);
    packageDidArrive(asset, progress);
}

void AppsClient::resolvePath(SyncAsset& asset) const {
    if (asset.path) {
        if (asset.path->starts_with('/')) return;
        asset.path = formatPath(kInDirectoryFormat, {kPublicStaging, *asset.path});
        return;
    }
    const auto recorded =
        _restoreStatePropertyForKey(kRestoreStatePathKey, asset.identifier, asset.version());
    if (recorded && recorded->isString()) asset.path = *recorded->asString();
}

void AppsClient::packageDidArrive(const SyncAssetPointer& asset, InstallProgressRecord* progress) {
    if (!asset->isRestore) {
        log_(Level::Default, "%s|Installing synced asset %{public}@", asset->identifier);
        _enqueueAssetInstall(asset);
    } else if (asset->completedParts != kAssetPartApplicationData) {
        restorePackageDidArrive(asset, progress);
    } else {
        _enqueueAssetInstall(asset);
    }
}

void AppsClient::restorePackageDidArrive(const SyncAssetPointer& asset,
                                         InstallProgressRecord* progress) {
    const std::string& identifier = asset->identifier;
    if (!_backupManager->restoreDataExists(identifier)) {
        log_(Level::Default, "%s|No restore data exists for %{public}@", identifier);
        _enqueueAssetInstall(asset);
        return;
    }
    log_(Level::Default, "%s|Restore data exists for %{public}@", identifier);
    if (progress != nullptr) progress->setInstallPhase(kInstallPhaseRestoringData);
    _setRestoreStatePropertyValue(*asset->path, kRestoreStatePathKey, identifier, asset->version());
}

void AppsClient::transferDidFail(const SyncAsset& asset, const ErrorRecord* error,
                                 InstallProgressRecord* progress) {
    const std::string& identifier = asset.identifier;
    const bool recoverable = _isRecoverableError(error);
    log_(Level::Default, "%s|failed to transfer asset %{public}@. err=%{public}@, recoverable=%d",
         identifier, error, recoverable);
    if (recoverable) {
        if (progress != nullptr) progress->setInstallState(kInstallStateFailed);
        return;
    }
    if (!platform_.registry.isApplicationInstalled(identifier)) return;
    if (asset.isRestore) return;
    removePlaceholder(asset, progress);
}

void AppsClient::removePlaceholder(const SyncAsset& asset, InstallProgressRecord* progress) {
    const std::string& identifier = asset.identifier;
    if (progress != nullptr && isCancellable(*progress)) progress->cancel();
    log_(Level::Default, "%s|Uninstalling placeholder %{public}@", identifier);
    // No restore comes here today; one that did would have its restore given up.
    if (asset.isRestore) _backupManager->cancelApplicationRestore(identifier);
    const Status uninstalled = platform_.registry.uninstallApplication(
        identifier, PropertyList::map({{UninstallPlaceholderOnlyKey, true}}));
    log_(Level::Default, "%s|Uninstalling app using RG %{public}@ %s", identifier,
         uninstalled ? "secceeded" : "failed");
}

void AppsClient::assetTransferEndedWithSuccess(bool success) {
    log_(Level::Default, "%s|asset transfer ended withsuccess: %c", yesOrNo(success));
    _installGroup->wait();
    _notifyDeskora(platform_, false);
    _getAndResetNumAppInstallsAttempted();
    const std::set<std::string> outstanding = _outstandingHFTTransfers.contents();
    if (outstanding.empty()) return;

    closeOutstandingTransfers(outstanding, success);
    if (success) {
        log_(Level::Error, "%s|Called with success == YES but with %lu outstanding HFT transfers!",
             outstanding.size());
    }
    _outstandingHFTTransfers.clear();
    _accessQueue->sync([this] {
        _updatingApps.clear();
        _userCancelledApps.clear();
    });
}

void AppsClient::closeOutstandingTransfers(const std::set<std::string>& outstanding, bool success) {
    const std::uint64_t state = success ? kInstallStateFinished : kInstallStateFailed;
    for (const std::string& identifier : outstanding) {
        log_(Level::Default,
             "%s|Setting state for outstanding HFT loading phase of asset %{public}@ to "
             "%{public}@",
             identifier, installStateName(state));
        const auto progress = _progressForAssetIdentifier(identifier);
        if (progress == nullptr) continue;
        progress->setInstallState(state);
        platform_.registry.finishInstallPhase(*progress);
    }
}

void AppsClient::applicationInstallsArePrioritized(const std::vector<AppProxy>& /*prioritized*/,
                                                   const std::vector<AppProxy>& /*paused*/) {}

void AppsClient::applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) {
    for (const AppProxy& proxy : cancelled) {
        if (proxy.installType != kInstallTypeRestore) continue;
        const ErrorRecord error{std::string(kSyncErrorDomain), kInstallCancelled, {}};
        assetTransferSucceeded(downloadAsset(proxy.applicationIdentifier), false, &error);
    }
}

}  // namespace appsync
