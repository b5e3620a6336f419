#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/SafeIdentifier.h"
#include "client/TodoList.h"
#include "coordination/InstallErrors.h"
#include "platform/BackupService.h"
#include "transfer/DownloadAsset.h"
#include "transfer/InstallNames.h"
#include "transfer/RestoreState.h"

namespace appsync {

/// What is known when a transfer ends.
struct AppsClient::TransferEnd {
    SyncAssetPointer asset;
    bool isExistingApp = false;
    bool isUserCancelled = false;
    // Null where there is none.
    std::shared_ptr<InstallProgressRecord> progress;
};

namespace {

constexpr std::int64_t kTotalUnits = 1000;

/// The fraction in thousandths, truncated toward zero. What is no number is none.
std::int64_t thousandths(double fraction) {
    constexpr double most = 1e15;
    const double scaled = fraction * static_cast<double>(kTotalUnits);
    if (std::isnan(scaled)) return 0;
    return static_cast<std::int64_t>(std::clamp(scaled, -most, most));
}

bool isCancellable(const InstallProgressRecord& progress) {
    return progress.installState() < kInstallStateCanceled;
}

}  // namespace

void AppsClient::assetTransferUpdatedProgress(const SyncAssetPointer& asset, double progress) {
    const std::string& identifier = asset->identifier;
    log_(Level::Default, "%s|finished transferring %lf for %{public}@", progress, identifier);
    if (_useInstallCoordinator) {
        bool isExistingApp = false;
        _accessQueue->sync([&] { isExistingApp = _updatingApps.contains(identifier); });
        updateTransferProgressForApp(*asset, isExistingApp);
    } else {
        updateProgressRecord(identifier, progress);
    }
    _outstandingHFTTransfers.insert(identifier);
}

void AppsClient::updateProgressRecord(const std::string& identifier, double fraction) const {
    const std::int64_t completed = thousandths(fraction);
    const auto record = _progressForAssetIdentifier(identifier);
    if (record == nullptr) return;
    record->setInstallState(kInstallStateActive);
    if (record->totalUnitCount() != kTotalUnits) record->setTotalUnitCount(kTotalUnits);
    record->setCompletedUnitCount(completed);
}

void AppsClient::assetTransferSucceeded(const SyncAssetPointer& asset, bool succeeded,
                                        const ErrorRecord* error) {
    const std::string& identifier = asset->identifier;
    TransferEnd end{asset, false, false, nullptr};
    _accessQueue->sync([&] {
        end.isExistingApp = _updatingApps.erase(identifier) != 0;
        end.isUserCancelled = _userCancelledApps.erase(identifier) != 0;
    });
    _outstandingHFTTransfers.erase(identifier);
    log_(Level::Default,
         "%s|transfer for asset %{public}@ ended with success %c error %{public}@ existingApp:%d",
         identifier, yesOrNo(succeeded), error, end.isExistingApp);
    end.progress = _progressForAssetIdentifier(identifier);
    if (succeeded) {
        transferDidSucceed(end);
    } else {
        transferDidFail(end, error);
    }
}

void AppsClient::transferDidSucceed(const TransferEnd& end) {
    SyncAsset& asset = *end.asset;
    log_(Level::Default, "%s|asset transfer succeeded for %{public}@", asset.identifier);
    finishLoading(end);
    resolvePath(asset);
    if (!isSafe(asset.path)) {
        log_(Level::Default, "%s|Ignoring invalid path: %{public}@", asset.path);
        return;
    }
    if (!asset.isDownload) {
        changeAssetID(asset.identifier, kTodoSent);
        return;
    }
    log_(Level::Default, "%s|Received file at %{public}@", asset.path);
    changeAssetID(asset.identifier, kTodoDownloaded);
    packageDidArrive(end);
}

void AppsClient::finishLoading(const TransferEnd& end) const {
    if (end.progress == nullptr) return;
    if (_useInstallCoordinator) {
        log_(Level::Default,
             "%s|not setting install phase finished for %{public}@ as coordination is enabled",
             end.asset->identifier);
        return;
    }
    platform_.registry.finishInstallPhase(*end.progress);
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

void AppsClient::packageDidArrive(const TransferEnd& end) {
    if (!end.asset->isRestore) {
        syncedPackageDidArrive(end);
    } else if (end.asset->completedParts != kAssetPartApplicationData) {
        restorePackageDidArrive(end);
    } else {
        restoreDataDidArrive(end);
    }
}

void AppsClient::syncedPackageDidArrive(const TransferEnd& end) {
    log_(Level::Default, "%s|Installing synced asset %{public}@", end.asset->identifier);
    if (_useInstallCoordinator) {
        transferCompleteForApp(*end.asset, nullptr, end.isExistingApp);
    } else {
        _enqueueAssetInstall(end.asset);
    }
}

void AppsClient::restorePackageDidArrive(const TransferEnd& end) {
    const SyncAsset& asset = *end.asset;
    if (_useInstallCoordinator) {
        log_(Level::Default,
             "%s|Not processing restore asset %{public}@ as coordination is enabled",
             asset.identifier);
        return;
    }
    if (!_backupManager->restoreDataExists(asset.identifier)) {
        log_(Level::Default, "%s|No restore data exists for %{public}@", asset.identifier);
        _enqueueAssetInstall(end.asset);
        return;
    }
    log_(Level::Default, "%s|Restore data exists for %{public}@", asset.identifier);
    if (end.progress != nullptr) end.progress->setInstallPhase(kInstallPhaseRestoringData);
    _setRestoreStatePropertyValue(*asset.path, kRestoreStatePathKey, asset.identifier,
                                  asset.version());
}

void AppsClient::restoreDataDidArrive(const TransferEnd& end) {
    if (_useInstallCoordinator) {
        log_(Level::Default,
             "%s|Not processing kTRAssetPartApplicationData for restore asset %{public}@ as "
             "coordination is enabled",
             end.asset->identifier);
        return;
    }
    _enqueueAssetInstall(end.asset);
}

void AppsClient::transferDidFail(const TransferEnd& end, const ErrorRecord* error) {
    const std::string& identifier = end.asset->identifier;
    const bool recoverable = _isRecoverableError(error);
    log_(Level::Default, "%s|failed to transfer asset %{public}@. err=%{public}@, recoverable=%d",
         identifier, error, recoverable);
    if (recoverable) {
        if (end.progress != nullptr) end.progress->setInstallState(kInstallStateFailed);
        return;
    }
    if (!platform_.registry.isApplicationInstalled(identifier)) return;
    if (end.asset->isRestore) return;
    giveUpInstall(end, error);
}

void AppsClient::giveUpInstall(const TransferEnd& end, const ErrorRecord* error) {
    const SyncAsset& asset = *end.asset;
    if (end.progress != nullptr && isCancellable(*end.progress)) end.progress->cancel();
    log_(Level::Default, "%s|Uninstalling placeholder %{public}@", asset.identifier);
    if (asset.isRestore) giveUpRestore(asset.identifier);
    if (!_useInstallCoordinator) {
        removePlaceholder(asset.identifier);
    } else if (!end.isUserCancelled) {
        // Without an error the coordinator would take the transfer for complete.
        const ErrorRecord unexplained = makeInstallError(InstallError::InstallFailed);
        transferCompleteForApp(asset, error != nullptr ? error : &unexplained, end.isExistingApp);
    }
}

// No restore comes here today; one that did would have its restore given up.
void AppsClient::giveUpRestore(const std::string& identifier) const {
    if (_useInstallCoordinator) {
        log_(Level::Default,
             "%s|Install coordination is enabled - not calling "
             "cancelApplicationRestoreWithBundleID for %{public}@",
             identifier);
        return;
    }
    _backupManager->cancelApplicationRestore(identifier);
}

void AppsClient::removePlaceholder(const std::string& identifier) const {
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

    if (_useInstallCoordinator) {
        assetSyncFinishedWithStatus(success, outstanding);
    } else {
        closeOutstandingTransfers(outstanding, success);
    }
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
    if (_useInstallCoordinator) {
        log_(Level::Default,
             "%s|not handling applicationInstallsDidCancel because install coordination is "
             "enabled.");
        return;
    }
    for (const AppProxy& proxy : cancelled) {
        if (proxy.installType != kInstallTypeRestore) continue;
        const ErrorRecord error = makeInstallError(InstallError::InstallCancelled);
        assetTransferSucceeded(makeDownloadAsset(proxy.applicationIdentifier), false, &error);
    }
}

}  // namespace appsync
