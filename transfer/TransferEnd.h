#pragma once

#include <atomic>
#include <memory>
#include <string>

#include "client/Log.h"
#include "platform/SyncAsset.h"

namespace appsync {

class AppsClient;
class BackupManager;
class InstallProgressRecord;
struct ErrorRecord;
struct Platform;

/// What a client knows when a transfer ends.
struct TransferEndFacts {
    SyncAssetPointer asset;
    bool isExistingApp = false;
    bool isUserCancelled = false;
};

/// The end of one transfer, and what follows from it.
class TransferEnd {
  public:
    /// Looks for the application's progress record. Borrows all but the facts; `isCoordinated` says
    /// whether installs are coordinated.
    TransferEnd(AppsClient& client, const Platform& platform, BackupManager& backup,
                const std::atomic<bool>& isCoordinated, TransferEndFacts facts);

    // One is called, once.

    /// The package, the data or both have come, or an upload is through.
    void succeed();
    /// `error` may be null: the transfer failed without saying why.
    void fail(const ErrorRecord* error);

  private:
    [[nodiscard]] const std::string& identifier() const { return facts_.asset->identifier; }
    void finishLoading() const;
    void resolvePath();
    void packageDidArrive();
    void syncedPackageDidArrive();
    void restorePackageDidArrive();
    void restoreDataDidArrive();
    void giveUpInstall(const ErrorRecord* error);
    void removePlaceholder() const;

    AppsClient& client_;
    const Platform& platform_;
    BackupManager& backup_;
    const std::atomic<bool>& isCoordinated_;
    const Log log_;
    const TransferEndFacts facts_;
    /// Null where there is none.
    const std::shared_ptr<InstallProgressRecord> progress_;
};

}  // namespace appsync
