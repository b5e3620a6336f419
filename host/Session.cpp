#include "host/Session.h"

#include <algorithm>
#include <cerrno>
#include <set>
#include <string_view>
#include <utility>

#include "client/Paths.h"
#include "device/Device.h"
#include "device/PackageIdentifier.h"
#include "host/PlugIn.h"
#include "host/SessionFacts.h"
#include "host/SessionWatch.h"
#include "host/SyncDaemon.h"
#include "host/SyncEvents.h"
#include "platform/AppRegistry.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"
#include "platform/SyncClient.h"

namespace appsync {
namespace {

constexpr std::string_view kDataclass = "Application";

void ignoreProgress(double) {}

bool owns(SyncClient& client, std::string_view dataclass) {
    const std::vector<std::string> supported = client.supportedDataclasses();
    return std::find(supported.begin(), supported.end(), dataclass) != supported.end();
}

ErrorRecord illegalIdentifier() {
    return ErrorRecord::make(kTransferErrorDomain, kTransferIllegalName,
                             "it is not a legal identifier: take it off the todo list");
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
      events_(events),
      facts_(facts),
      stopRequested_(stopRequested),
      sender_(device) {}

SessionEnd Session::sync(const PackageSource& packages) {
    const auto disabled = client_.disabledAssetTypes();
    end_.isDisabled =
        !owns(client_, kDataclass) || (disabled && disabled->contains(std::string(kDataclass)));
    if (end_.isDisabled) return end_;
    const std::string anchor = client_.currentSyncAnchor();
    client_.prepareForSyncWithHostAnchor(anchor, ignoreProgress, nullptr);
    std::optional<ErrorRecord> error;
    watch_.setRemoving(true);
    const bool reconciled =
        client_.reconcileSync(PropertyList::map(), anchor, ignoreProgress, &error);
    watch_.setRemoving(false);
    if (!reconciled) {
        end_.error = error.value_or(ErrorRecord::make(kPosixErrorDomain, EIO, "it cannot begin"));
        return end(false, {});
    }
    static_cast<void>(client_.installedAssets());
    for (const SyncAssetPointer& asset : client_.outstandingAssetTransfers()) {
        facts_.requested(asset->identifier);
        if (!stopRequested_) transfer(asset, packages);
    }
    return end(!stopRequested_, {});
}

SessionEnd Session::deliver(const Parcel& parcel) {
    const std::vector<std::string> known = readLastSyncState(device_);
    // Where the plug-in and the host keep their records; a device that was never synced lacks it.
    const Status ready = device_.files().createDirectory(std::string(kWorkArea), true, nullptr);
    if (!ready) {
        end_.error = ready.error();
        return end_;
    }
    client_.prepareForSyncWithHostAnchor(client_.currentSyncAnchor(), ignoreProgress, nullptr);
    facts_.requested(parcel.asset->identifier);
    send(parcel);
    return end(!stopRequested_, known);
}

Result<std::string> Session::packageOf(const SyncAsset& asset, const PackageSource& packages) {
    if (!isLegalIdentifier(asset.identifier)) return illegalIdentifier();
    return packages(asset.identifier);
}

void Session::transfer(const SyncAssetPointer& asset, const PackageSource& packages) {
    Result<std::string> file = packageOf(*asset, packages);
    if (file) {
        send({asset, *std::move(file), std::string(kPublicStaging), asset->identifier + ".zip"});
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
        return !stopRequested_;
    };
    const Result<std::uint64_t> sent =
        sender_.send(parcel.file, parcel.directory, parcel.name, progress);
    if (!sent) return reportFailure(asset, sent.error());
    facts_.sent(*sent);
    event.kind = SyncEventKind::Ended;
    event.state = SyncState::Finished;
    events_.report(event);
    watch_.setSize(asset->identifier, *sent);
    if (!parcel.keepsPath) asset->path = parcel.name;
    client_.assetTransferSucceeded(asset, true, nullptr);
}

void Session::reportFailure(const SyncAssetPointer& asset, const ErrorRecord& error) {
    facts_.failed(asset->identifier, error.description());
    events_.report({SyncEventKind::Ended, SyncPhase::Transfer, asset->identifier, 0, 0,
                    SyncState::Failed, std::nullopt, error.description()});
    client_.assetTransferSucceeded(asset, false, &error);
}

const SessionEnd& Session::end(bool transfersSucceeded, const std::vector<std::string>& known) {
    client_.assetTransferEndedWithSuccess(transfersSucceeded);
    end_.isInterrupted = stopRequested_;
    const bool isSuccess = end_.isSuccess();
    client_.syncEndedWithSuccess(isSuccess);
    if (!isSuccess) return end_;
    const Status written = writeLastSyncState(device_, known);
    if (!written) end_.error = written.error();
    return end_;
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
