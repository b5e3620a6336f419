#include <atomic>
#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>

#include "client/Paths.h"
#include "device/Device.h"
#include "device/PackageIdentifier.h"
#include "device/PackageReader.h"
#include "host/Commands.h"
#include "host/Console.h"
#include "host/Interruption.h"
#include "host/PlugIn.h"
#include "host/Problem.h"
#include "host/Session.h"
#include "host/SessionFacts.h"
#include "host/StagingArea.h"
#include "host/StopSignals.h"
#include "host/SyncOutcome.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::string_view kApplicationData = "/var/mobile/Containers/Data";

Status checkArguments(const SendArguments& arguments) {
    if (!isLegalIdentifier(arguments.identifier)) {
        return wrongUsage(arguments.identifier + " is not an identifier",
                          "use letters, digits, '.', '-' and '_'");
    }
    if (!arguments.isRestore && arguments.parts != kAssetPartApplication) {
        return wrongUsage("--parts " + std::to_string(arguments.parts) + " without --restore",
                          "only a restore comes in parts");
    }
    return {};
}

// The version under which the package of a restore waits for its data; nothing when none does.
std::optional<std::string> waitingVersion(Device& device, const std::string& identifier) {
    const Result<Bytes> bytes = device.files().readFile(std::string(kRestoreStatePath));
    if (!bytes) return std::nullopt;
    const Result<PropertyList> state = device.propertyLists().parse(*bytes);
    if (!state) return std::nullopt;
    const PropertyList* versions = state->find(identifier);
    if (versions == nullptr || versions->entries().empty()) return std::nullopt;
    return versions->entries().back().key;
}

class Sending {
  public:
    Sending(const SendArguments& arguments, const Console& console,
            const std::atomic<bool>& stopRequested)
        : arguments_(arguments),
          console_(console),
          stopRequested_(stopRequested),
          display_(makeSyncDisplay(arguments.display, console)),
          events_(*display_) {}

    Result<int> run() {
        Result<std::unique_ptr<Device>> device =
            Device::open(arguments_.device, {DeviceAccess::Session});
        if (!device) return unusable(device.error());
        device_ = *std::move(device);
        Status ready = removeStaleTransfers(*device_);
        if (ready) ready = isData() ? prepareData() : preparePackage();
        if (!ready) return ready.error();
        if (stopRequested_) return failure("interrupted before the session began", "run it again");
        return hold();
    }

  private:
    [[nodiscard]] bool isData() const { return arguments_.parts == kAssetPartApplicationData; }

    void makeAsset(const std::string& version) {
        parcel_.asset = std::make_shared<SyncAsset>();
        parcel_.asset->identifier = arguments_.identifier;
        parcel_.asset->dataclass = "Application";
        parcel_.asset->isRestore = arguments_.isRestore;
        parcel_.asset->completedParts = arguments_.parts;
        parcel_.asset->variantOptions.set("AssetParts", arguments_.parts);
        if (!version.empty()) parcel_.asset->variantOptions.set("Version", version);
        parcel_.file = arguments_.file;
    }

    // A package that cannot be read is sent all the same: the device judges it.
    Status preparePackage() {
        const Result<PackageReader> package =
            PackageReader::open(arguments_.file, device_->propertyLists());
        const std::string version = package ? package->info().version : "";
        makeAsset(version);
        parcel_.directory = kPublicStaging;
        parcel_.name = arguments_.identifier + ".zip";
        PlannedInstall planned{arguments_.identifier, {}, {}, {}, 0, 0};
        if (package) planned.newVersion = version;
        if (arguments_.isRestore && arguments_.parts == kAssetPartApplication) {
            plansInstall_ = false;  // it waits for the data that is still to come
        }
        return planInstall(std::move(planned));
    }

    Status prepareData() {
        const std::optional<std::string> version = waitingVersion(*device_, arguments_.identifier);
        if (!version) {
            return failure("no package of " + arguments_.identifier + " waits for its data",
                           "send the package first, with --restore --parts 1");
        }
        makeAsset(*version);
        parcel_.keepsPath = true;  // the package's, which the plug-in has kept
        parcel_.directory = std::string(kApplicationData) + "/" + arguments_.identifier;
        parcel_.name = std::filesystem::path(arguments_.file).filename().string();
        return planInstall({arguments_.identifier, {}, {}, *version, 0, 0});
    }

    Status planInstall(PlannedInstall planned) {
        if (arguments_.isRestore && !isData()) {
            const Status known =
                device_->setRestoreDataExpected(arguments_.identifier, !plansInstall_);
            if (!known) return known;
        }
        const Result<std::vector<ApplicationRecord>> present = device_->applications();
        if (!present) return unusable(present.error());
        if (!plansInstall_) return {};
        bool isUpdate = false;
        for (const ApplicationRecord& record : *present) {
            if (record.identifier != planned.identifier || record.isPlaceholder) continue;
            isUpdate = true;
        }
        (isUpdate ? plan_.update : plan_.install).push_back(std::move(planned));
        return {};
    }

    Result<int> hold() {
        Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(*device_, events_, facts_);
        if (!plugIn) return plugIn.error();
        Session session(*device_, **plugIn, events_, facts_, stopRequested_);
        const SessionEnd end = session.deliver(parcel_);
        const Result<SessionAftermath> aftermath = aftermathOf(*device_, end);
        if (!aftermath) return aftermath.error();
        SyncSummary summary = summarize(plan_, facts_, *aftermath);
        if (!plansInstall_ && summary.failed.empty()) {
            summary.skipped.push_back(
                {arguments_.identifier, "its package waits for its data", false});
        }
        summary.bytes = end.bytes;
        summary.seconds = std::chrono::duration<double>(Clock::now() - begin_).count();
        events_.finish(summary);
        if (end.isInterrupted) console_.fail(failure("interrupted", kRunAgain));
        return summary.incomplete ? kExitSomethingFailed : kExitDone;
    }

    const SendArguments& arguments_;
    const Console& console_;
    const std::atomic<bool>& stopRequested_;
    std::unique_ptr<SyncDisplay> display_;
    SyncEvents events_;
    SessionFacts facts_;
    std::unique_ptr<Device> device_;
    Session::Parcel parcel_;
    SyncPlan plan_;
    bool plansInstall_ = true;
    const Clock::time_point begin_ = Clock::now();
};

}  // namespace

int runSend(const SendArguments& arguments, const Console& console) {
    const Status checked = checkArguments(arguments);
    if (!checked) return console.fail(checked.error());
    const StopSignals signals(kPatience, [&console] { leaveAtOnce(console); });
    const Result<int> status = Sending(arguments, console, signals.stopRequested()).run();
    return status ? *status : console.fail(status.error());
}

}  // namespace appsync
