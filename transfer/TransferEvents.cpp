#include <algorithm>
#include <cmath>
#include <cstdint>
#include <utility>

#include "client/AppsClient.h"
#include "coordination/InstallErrors.h"
#include "transfer/DownloadAsset.h"
#include "transfer/InstallNames.h"
#include "transfer/TransferEnd.h"

namespace appsync {

namespace {

constexpr std::int64_t kTotalUnits = 1000;

/// The fraction in thousandths, truncated toward zero. What is no number is none.
std::int64_t thousandths(double fraction) {
    constexpr double most = 1e15;
    const double scaled = fraction * static_cast<double>(kTotalUnits);
    if (std::isnan(scaled)) return 0;
    return static_cast<std::int64_t>(std::clamp(scaled, -most, most));
}

void updateProgressRecord(const AppsClient& client, const std::string& identifier,
                          double fraction) {
    const std::int64_t completed = thousandths(fraction);
    const auto record = client._progressForAssetIdentifier(identifier);
    if (record == nullptr) return;
    record->setInstallState(kInstallStateActive);
    if (record->totalUnitCount() != kTotalUnits) record->setTotalUnitCount(kTotalUnits);
    record->setCompletedUnitCount(completed);
}

void closeOutstandingTransfers(const AppsClient& client, const Platform& platform,
                               const std::set<std::string>& outstanding, bool success) {
    const std::uint64_t state = success ? kInstallStateFinished : kInstallStateFailed;
    const Log log(platform);
    for (const std::string& identifier : outstanding) {
        log(Level::Default,
            "%s|Setting state for outstanding HFT loading phase of asset %{public}@ to "
            "%{public}@",
            identifier, installStateName(state));
        const auto progress = client._progressForAssetIdentifier(identifier);
        if (progress == nullptr) continue;
        progress->setInstallState(state);
        platform.registry.finishInstallPhase(*progress);
    }
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
        updateProgressRecord(*this, identifier, progress);
    }
    _outstandingHFTTransfers.insert(identifier);
}

void AppsClient::assetTransferSucceeded(const SyncAssetPointer& asset, bool succeeded,
                                        const ErrorRecord* error) {
    const std::string& identifier = asset->identifier;
    TransferEndFacts facts{.asset = asset};
    _accessQueue->sync([&] {
        facts.isExistingApp = _updatingApps.erase(identifier) != 0;
        facts.isUserCancelled = _userCancelledApps.erase(identifier) != 0;
    });
    _outstandingHFTTransfers.erase(identifier);
    log_(Level::Default,
         "%s|transfer for asset %{public}@ ended with success %c error %{public}@ existingApp:%d",
         identifier, yesOrNo(succeeded), error, facts.isExistingApp);
    TransferEnd end(*this, platform_, *_backupManager, _useInstallCoordinator, std::move(facts));
    if (succeeded) {
        end.succeed();
    } else {
        end.fail(error);
    }
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
        closeOutstandingTransfers(*this, platform_, outstanding, success);
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
