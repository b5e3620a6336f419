#pragma once

// host/session: the desktop host's and the sync daemon's side of one session with the plug-in.
//
//     Session.h         the order of calls; sends with PackageSender.h
//     PlugIn.h          loads the plug-in on a device
//     SyncOutcome.h     holds plan, facts and device against each other: what failed, and why
//     StopSignals.h     Ctrl-C; Interruption.h is what is said then
//     Parcels.h, AppStore.h, Inventory.h    what `send`, `store` and `inventory` are about
//     StoreDelivery.h   how the app store keeps the promise of one package
//
// What is to be done comes from host/plan, where nothing runs; what becomes of it is seen by
// host/watch, which includes nothing of this; how it is shown is for host/output. Called by the
// commands, by host/output and by host/backup (a restore is a session too).

#include <atomic>
#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "client/Log.h"
#include "host/session/PackageSender.h"
#include "platform/Error.h"
#include "platform/Result.h"
#include "platform/SyncAsset.h"

namespace appsync {

class Device;
class PlugIn;
struct CoordinatorRecord;
class SessionFacts;
class SessionWatch;
class SyncClient;
class SyncEvents;
class SyncHost;
class TransferQueue;

/// How a session ended.
struct SessionEnd {
    /// Device policy rules the whole dataclass out; nothing was done.
    bool isDisabled = false;
    /// The person stopped it before all was done.
    bool isInterrupted = false;
    /// Why nothing could be transferred at all.
    std::optional<ErrorRecord> error;

    [[nodiscard]] bool isSuccess() const { return !isDisabled && !isInterrupted && !error; }
};

/// The sync daemon's side of one session with the plug-in: calls it in the order that SyncClient
/// names, and sends it what it asks for.
class Session {
  public:
    /// The file with the package of an identifier, or why there is none.
    using PackageSource = std::function<Result<std::string>(const std::string& identifier)>;

    /// Everything must outlive the session.
    /// The plug-in was loaded with a watch on the same events and facts.
    Session(Device& device, PlugIn& plugIn, SyncEvents& events, SessionFacts& facts,
            const std::atomic<bool>& stopRequested);

    /// What a sync is to do with what the device asks for.
    struct Order {
        PackageSource packages;
        /// Whether this session sends the application's package at all.
        std::function<bool(const std::string& identifier)> sends;
        /// Whether the host takes note of what was uninstalled on the device.
        bool takesInventory = true;
        /// Called when all is ready for the first transfer.
        std::function<void()> prepared = nullptr;
    };
    /// A whole sync with what stands in the staging area. Returns when every install has ended, on
    /// the device's own path or through its coordination service.
    [[nodiscard]] SessionEnd sync(const Order& order);

    /// A session that brings one asset that the device has not asked for. The asset's path is set
    /// from where the file was put: `directory`/`name` of the device; not when `keepsPath`.
    struct Parcel {
        SyncAssetPointer asset;
        std::string file;
        std::string directory;
        std::string name;
        bool keepsPath = false;
    };
    [[nodiscard]] SessionEnd deliver(const Parcel& parcel);

  private:
    void takeUpDelivered(const Order& order);
    [[nodiscard]] bool reconcile();
    [[nodiscard]] bool isCancelled(const std::string& identifier);
    void transferAll(const std::vector<SyncAssetPointer>& assets, const PackageSource& packages);
    void transfer(const SyncAssetPointer& asset, const PackageSource& packages);
    Result<std::string> packageOf(const SyncAsset& asset, const PackageSource& packages);
    void send(const Parcel& parcel);
    [[nodiscard]] ErrorRecord causeOf(const ErrorRecord& error) const;
    void reportFailure(const SyncAssetPointer& asset, const ErrorRecord& error);
    void awaitCoordinatedInstalls();
    void cancelWhere(const std::function<bool(const CoordinatorRecord&)>& isToGo);
    // `known`: the applications that the last session saw, where this one does not look.
    const SessionEnd& end(const std::vector<std::string>& known);

    Device& device_;
    SyncClient& client_;
    SessionWatch& watch_;
    TransferQueue& transfers_;
    const SyncHost& host_;
    SyncEvents& events_;
    SessionFacts& facts_;
    const std::atomic<bool>& stopRequested_;
    const Log log_;
    PackageSender sender_;
    std::vector<std::string> givenUp_;  // whose transfers have failed for good
    std::set<std::string> takenUp_;     // whose packages an earlier session has delivered
    bool isCutShort_ = false;           // something was left out because of a stop
    SessionEnd end_;
};

/// Writes the identifiers of the user applications that are present, beside those of `also`, so
/// that the next session can tell what has gone.
Status writeLastSyncState(Device& device, const std::vector<std::string>& also);

/// The identifiers that the last session wrote; none when there are none.
[[nodiscard]] std::vector<std::string> readLastSyncState(Device& device);

}  // namespace appsync
