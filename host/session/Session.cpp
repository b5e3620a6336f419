#include "host/session/Session.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <set>
#include <string_view>
#include <utility>

#include "client/Paths.h"
#include "device/Device.h"
#include "device/values/PackageIdentifier.h"
#include "host/plan/StandingInstalls.h"
#include "host/plan/TransferError.h"
#include "host/session/PlugIn.h"
#include "host/watch/SessionFacts.h"
#include "host/watch/SessionWatch.h"
#include "host/watch/SyncDaemon.h"
#include "host/watch/SyncEvents.h"
#include "host/watch/TransferQueue.h"
#include "platform/AppRegistry.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"
#include "platform/SyncClient.h"

namespace appsync {
namespace {

// How often a wait looks whether it is to stop.
constexpr std::chrono::milliseconds kStopInterval{50};

void ignoreProgress(double) {}

bool owns(SyncClient& client, std::string_view dataclass) {
    const std::vector<std::string> supported = client.supportedDataclasses();
    return std::find(supported.begin(), supported.end(), dataclass) != supported.end();
}

ErrorRecord illegalIdentifier() {
    return ErrorRecord::make(kTransferErrorDomain, kTransferIllegalName,
                             "it is not a legal identifier (" + std::string(kIdentifierRule) +
                                 "): take it off the todo list");
}

ErrorRecord cancelledByDevice() {
    return ErrorRecord::make(kTransferErrorDomain, kTransferCancelled,
                             "the device cancelled its install: sync it again to have it");
}

bool isOfInterruption(const ErrorRecord& error) {
    return error.domain == kTransferErrorDomain && error.code == kTransferInterrupted;
}

bool isUserApplication(const ApplicationRecord& record) {
    const bool isOfSync = record.isPlaceholder && record.installType == kInstallTypeSync;
    return record.type == kApplicationTypeUser && !isOfSync;
}

}  // namespace

Session::Session(Device& device, PlugIn& plugIn, SyncEvents& events, SessionFacts& facts,
                 const std::atomic<bool>& stopRequested)
    : device_(device),
      client_(plugIn.client()),
      watch_(plugIn.watch()),
      transfers_(plugIn.transfers()),
      host_(plugIn.host()),
      events_(events),
      facts_(facts),
      stopRequested_(stopRequested),
      log_(plugIn.platform()),
      sender_(device) {}

SessionEnd Session::sync(const Order& order) {
    const auto disabled = client_.disabledAssetTypes();
    end_.isDisabled = !owns(client_, kApplicationDataclass) ||
                      (disabled && disabled->contains(std::string(kApplicationDataclass)));
    if (end_.isDisabled) return end_;
    takeUpDelivered(order);
    const std::vector<std::string> known =
        order.takesInventory ? std::vector<std::string>() : readLastSyncState(device_);
    if (!reconcile()) return end({});
    if (order.takesInventory) static_cast<void>(client_.installedAssets());
    std::vector<SyncAssetPointer> assets;
    for (SyncAssetPointer& asset : client_.outstandingAssetTransfers()) {
        if (!order.sends(asset->identifier)) continue;
        facts_.requested(asset->identifier);
        assets.push_back(std::move(asset));
    }
    if (order.prepared) order.prepared();
    device_.letCoordinatedInstallsGo();
    transferAll(assets, order.packages);
    return end(known);
}

// What an interrupted session has delivered, except where this one begins anew.
void Session::takeUpDelivered(const Order& order) {
    for (const std::string& identifier : device_.coordinatedInstallsUnderWay()) {
        if (order.sends(identifier)) continue;
        watch_.takeUpDelivered(identifier);
        takenUp_.insert(identifier);
    }
}

// Ends when every removal has, also those that the plug-in does not wait for: an application that
// is removed and comes anew must be gone before the device is asked what it wants.
bool Session::reconcile() {
    const std::string anchor = client_.currentSyncAnchor();
    client_.prepareForSyncWithHostAnchor(anchor, ignoreProgress, nullptr);
    std::optional<ErrorRecord> error;
    watch_.setRemoving(true);
    const bool reconciled =
        client_.reconcileSync(PropertyList::map(), anchor, ignoreProgress, &error);
    isCutShort_ = !watch_.waitForUninstalls(stopRequested_);
    watch_.setRemoving(false);
    if (reconciled && !isCutShort_) facts_.reconciled();
    if (reconciled) return true;
    end_.error = error.value_or(ErrorRecord::make(kPosixErrorDomain, EIO, "it cannot begin"));
    return false;
}

void Session::transferAll(const std::vector<SyncAssetPointer>& assets,
                          const PackageSource& packages) {
    transfers_.fill(assets);
    while (const SyncAssetPointer asset = transfers_.next()) {
        if (stopRequested_) {
            isCutShort_ = true;
            transfers_.finish();
            return;
        }
        transfer(asset, packages);
        transfers_.finish();
    }
}

SessionEnd Session::deliver(const Parcel& parcel) {
    const std::vector<std::string> known = readLastSyncState(device_);
    // Where the plug-in and the host keep their records; a device that was never synced lacks it.
    const Status ready = device_.files().createDirectory(std::string(kWorkArea), true, nullptr);
    if (!ready) {
        end_.error = ready.error();
        return end_;
    }
    log_.general(Level::Default, "%s sends %{public}@, which the device has not asked for",
                 host_.mainBundleIdentifier(), parcel.asset->identifier);
    device_.letCoordinatedInstallsGo();
    client_.prepareForSyncWithHostAnchor(client_.currentSyncAnchor(), ignoreProgress, nullptr);
    facts_.reconciled();
    facts_.requested(parcel.asset->identifier);
    transfers_.fill({parcel.asset});
    static_cast<void>(transfers_.next());
    send(parcel);
    transfers_.finish();
    return end(known);
}

Result<std::string> Session::packageOf(const SyncAsset& asset, const PackageSource& packages) {
    if (!isLegalIdentifier(asset.identifier)) return illegalIdentifier();
    return packages(asset.identifier);
}

void Session::transfer(const SyncAssetPointer& asset, const PackageSource& packages) {
    if (isCancelled(asset->identifier)) return reportFailure(asset, cancelledByDevice());
    Result<std::string> file = packageOf(*asset, packages);
    if (file) {
        send({asset, *std::move(file), std::string(kPublicStaging),
              archiveNameOf(asset->identifier)});
    } else {
        reportFailure(asset, file.error());
    }
}

void Session::send(const Parcel& parcel) {
    const SyncAssetPointer& asset = parcel.asset;
    SyncEvent event{SyncEventKind::Started,
                    SyncPhase::Transfer,
                    asset->identifier,
                    0,
                    0,
                    SyncState::Active,
                    std::nullopt,
                    ""};
    const auto progress = [&](std::uint64_t done, std::uint64_t total) {
        event.total = total;
        if (event.kind == SyncEventKind::Started) events_.report(event);
        event.kind = SyncEventKind::Progress;
        event.done = done;
        events_.report(event);
        asset->downloadProgress = static_cast<double>(done) / static_cast<double>(total);
        client_.assetTransferUpdatedProgress(asset, asset->downloadProgress);
        return !stopRequested_ && !isCancelled(asset->identifier);
    };
    // What a restore brings may wait on the device for its other part, also through a crash.
    const Result<std::uint64_t> sent =
        asset->isRestore ? sender_.sendWhole(parcel.file, parcel.directory, parcel.name, progress)
                         : sender_.send(parcel.file, parcel.directory, parcel.name, progress);
    if (!sent) return reportFailure(asset, causeOf(sent.error()));
    facts_.sent(*sent);
    event.kind = SyncEventKind::Ended;
    event.state = SyncState::Finished;
    events_.report(event);
    watch_.setSize(asset->identifier, *sent);
    watch_.packageSent(asset->identifier, parcel.directory + "/" + parcel.name, parcel.file);
    if (!parcel.keepsPath) asset->path = parcel.name;
    if (watch_.isCoordinated()) watch_.packageDelivered(asset->identifier);
    client_.assetTransferSucceeded(asset, true, nullptr);
}

// A cancel may be of an earlier coordinator of the same application, of which the device tells
// late.
bool Session::isCancelled(const std::string& identifier) {
    if (!transfers_.isCancelled()) return false;
    const Result<ApplicationStatus> status = device_.status(identifier);
    const bool stands =
        status && status->coordinator && status->coordinator->client == SyncClientID;
    if (stands) transfers_.dismissCancel();
    return !stands;
}

// A transfer that stops may do so because the device wants it no more.
ErrorRecord Session::causeOf(const ErrorRecord& error) const {
    return transfers_.isCancelled() && !stopRequested_ ? cancelledByDevice() : error;
}

void Session::reportFailure(const SyncAssetPointer& asset, const ErrorRecord& error) {
    const std::string& identifier = asset->identifier;
    facts_.failed(identifier, error.description());
    const std::string cause = facts_.firstFailure(identifier).value_or(error.description());
    events_.report({SyncEventKind::Ended, SyncPhase::Transfer, identifier, 0, 0, SyncState::Failed,
                    std::nullopt, cause});
    if (isOfInterruption(error)) isCutShort_ = true;
    if (!host_.isRecoverableError(error)) givenUp_.push_back(identifier);
    client_.assetTransferSucceeded(asset, false, &error);
}

// A stop that comes when nothing is left to do interrupts nothing.
const SessionEnd& Session::end(const std::vector<std::string>& known) {
    device_.letCoordinatedInstallsGo();
    watch_.nothingMoreIsSent();
    client_.assetTransferEndedWithSuccess(!isCutShort_ && !end_.error);
    if (watch_.isCoordinated()) {
        cancelWhere([this](const CoordinatorRecord& each) {
            return std::find(givenUp_.begin(), givenUp_.end(), each.identifier) != givenUp_.end();
        });
        awaitCoordinatedInstalls();
        cancelWhere([this](const CoordinatorRecord& each) {
            return takenUp_.contains(each.identifier) && !each.isComplete && !each.restores();
        });
    }
    end_.isInterrupted = isCutShort_;
    const bool isSuccess = end_.isSuccess();
    client_.syncEndedWithSuccess(isSuccess);
    // What is being installed at this moment ends here; whoever looks at the device then sees it.
    if (end_.isInterrupted && watch_.isCoordinated()) device_.closeCoordination();
    if (!isSuccess) return end_;
    const Status written = writeLastSyncState(device_, known);
    if (!written) end_.error = written.error();
    return end_;
}

// Cancels coordinators of the sync client to which no package will come in this session:
//
// - The plug-in looks for something on the device before it cancels the coordinator of a package
//   that does not come; the placeholder may have come to stand there after it looked.
// - Somebody may cancel an install that was taken up, after the plug-in has seen its placeholder
// and
//   before it prepares what that stands for.
void Session::cancelWhere(const std::function<bool(const CoordinatorRecord&)>& isToGo) {
    if (givenUp_.empty() && takenUp_.empty()) return;
    const Result<std::vector<CoordinatorRecord>> coordinators = device_.coordinators();
    if (!coordinators) return;  // the session's end finds the same failure
    StandingInstalls standing;
    for (const CoordinatorRecord& each : *coordinators) {
        if (each.client == SyncClientID && isToGo(each)) {
            standing.obsolete.push_back(each.identifier);
        }
    }
    const Status cancelled = cancelObsolete(device_, standing);
    if (!cancelled && !end_.error) end_.error = cancelled.error();
}

// The plug-in has done its part when the transfers have; what the coordination service does with
// the packages belongs to the session all the same: its end says that the device is in step.
void Session::awaitCoordinatedInstalls() {
    while (!device_.waitForCoordinatedInstalls(kStopInterval)) {
        if (!stopRequested_ && !watch_.isWaitOver()) continue;
        isCutShort_ = true;
        return;
    }
    watch_.settleDelivered();
}

std::vector<std::string> readLastSyncState(Device& device) {
    std::vector<std::string> identifiers;
    const Result<Bytes> bytes = device.files().readFile(std::string(kLastSyncAppStatePath));
    if (!bytes) return identifiers;
    const Result<PropertyList> list = device.propertyLists().parse(*bytes);
    if (!list) return identifiers;
    for (const PropertyList& each : list->elements()) {
        if (const std::string* identifier = each.asString()) identifiers.push_back(*identifier);
    }
    return identifiers;
}

Status writeLastSyncState(Device& device, const std::vector<std::string>& also) {
    const Result<std::vector<ApplicationRecord>> present = device.applications();
    if (!present) return present.error();
    std::set<std::string> identifiers(also.begin(), also.end());
    for (const ApplicationRecord& record : *present) {
        if (isUserApplication(record)) identifiers.insert(record.identifier);
    }
    const std::vector<std::string> sorted(identifiers.begin(), identifiers.end());
    const Result<Bytes> bytes =
        device.propertyLists().serialize(PropertyList::strings(sorted), PropertyListFormat::Binary);
    if (!bytes) return bytes.error();
    return device.files().writeFileAtomically(std::string(kLastSyncAppStatePath), *bytes);
}

}  // namespace appsync
