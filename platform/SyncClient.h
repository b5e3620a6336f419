#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/Error.h"
#include "platform/PropertyList.h"
#include "platform/SyncAccountInfo.h"
#include "platform/SyncAsset.h"

namespace appsync {

/// Called with a fraction from 0.0 to 1.0.
using SyncProgressCallback = std::function<void(double)>;

/// What the SyncHost calls on a plug-in. All on the host's thread, one at a time within a session,
/// in this order:
///
///     prepareForSyncWithHostAnchor
///     ( reconcileSync | reconcileRestoreOfType )
///     [ installedAssets, installedAssetMetrics, korvuIDsForAssets, accountsForAssets ]
///     outstandingAssetTransfers
///     { { assetTransferUpdatedProgress } assetTransferSucceeded }    for each asset
///     assetTransferEndedWithSuccess
///     syncEndedWithSuccess
///
/// `supportedDataclasses`, `currentSyncAnchor`, `disabledAssetTypes`, `clearSyncData` and
/// `prepareForBackup` may be called outside a session. A call blocks while it works. Nothing
/// throws; failures are told by a false or absent result, and by the error where there is one. No
/// asset is null, neither one that is handed out nor one that is handed in.
class SyncClient {
  public:
    virtual ~SyncClient() = default;

    /// `supportedDataclasses`: the dataclasses that this plug-in owns.
    [[nodiscard]] virtual std::vector<std::string> supportedDataclasses() = 0;
    /// `currentSyncAnchor`: the anchor of the last session.
    [[nodiscard]] virtual std::string currentSyncAnchor() = 0;
    /// `prepareForSyncWithHostAnchor:progressCallback:error:`: a session begins.
    virtual bool prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                              const SyncProgressCallback& progressCallback,
                                              ErrorOut error) = 0;
    /// `disabledAssetTypes`: the dataclasses that device policy rules out; absent when none is.
    [[nodiscard]] virtual std::optional<std::set<std::string>> disabledAssetTypes() = 0;

    /// `reconcileSync:withNewAnchor:progressCallback:error:`: takes over what the host left in the
    /// staging area and performs the removals in it. False with the file system's error when the
    /// staging area cannot be taken over.
    virtual bool reconcileSync(const PropertyList& request, const std::string& newAnchor,
                               const SyncProgressCallback& progressCallback, ErrorOut error) = 0;
    /// `reconcileRestoreOfType:withError:`: the device has been restored from a backup. For types 2
    /// and 3 every application of the backup becomes a placeholder; blocks until those are there,
    /// at most 5 seconds for each. Always true, without an error.
    virtual bool reconcileRestoreOfType(std::int64_t type, ErrorOut error) = 0;
    /// `syncEndedWithSuccess:`: the session is over.
    virtual void syncEndedWithSuccess(bool success) = 0;

    /// `installedAssets`: a map whose only key is "_Deleted": an array of identifiers, strings, of
    /// what has gone since the last session. The array may be empty.
    [[nodiscard]] virtual PropertyList installedAssets() = 0;
    /// `clearSyncData`: forget everything that is kept for syncing.
    virtual void clearSyncData() = 0;
    /// `installedAssetMetrics`: a map of "_Count", "_PhysicalSize" and "_PurgeableSize" (bytes).
    [[nodiscard]] virtual PropertyList installedAssetMetrics() = 0;
    /// `korvuIDsForAssets`: the account identifiers that own the installed applications.
    [[nodiscard]] virtual std::set<std::string> korvuIDsForAssets() = 0;
    /// `accountsForAssets`: the accounts that own them, one record each.
    [[nodiscard]] virtual std::set<SyncAccountInfo> accountsForAssets() = 0;

    /// `prepareForBackup`: a backup is about to be taken.
    virtual void prepareForBackup() = 0;

    /// `outstandingAssetTransfers`: the assets that the host should send, in this order.
    [[nodiscard]] virtual std::vector<SyncAssetPointer> outstandingAssetTransfers() = 0;
    /// `assetTransfer:updatedProgress:`: a fraction from 0.0 to 1.0 of the asset has come.
    virtual void assetTransferUpdatedProgress(const SyncAssetPointer& asset, double progress) = 0;
    /// `assetTransfer:succeeded:withError:`: the asset's transfer is over; `error` may be null.
    virtual void assetTransferSucceeded(const SyncAssetPointer& asset, bool succeeded,
                                        const ErrorRecord* error) = 0;
    /// `assetTransferEndedWithSuccess:`: no more transfers will come. Blocks until every install
    /// that was started has ended.
    virtual void assetTransferEndedWithSuccess(bool success) = 0;

    // For the plug-in itself, at the end of each direct install, on the thread that installed. No
    // host calls them: it learns of outcomes from the todo list.

    /// `assetInstallSucceeded:`: the asset's install has succeeded.
    virtual void assetInstallSucceeded(const SyncAssetPointer& asset) = 0;
    /// `assetInstallFailed:withError:`: the asset's install has failed. Uninstalls what the install
    /// left: after a success that would be the application.
    virtual void assetInstallFailed(const SyncAssetPointer& asset, const ErrorRecord& error) = 0;
};

}  // namespace appsync
