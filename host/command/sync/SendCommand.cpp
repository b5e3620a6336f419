#include <unistd.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>

#include "device/Device.h"
#include "device/package/DataArchive.h"
#include "device/package/PackageReader.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/sync/SyncCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "host/module/PlugInModule.h"
#include "host/plan/InterruptedStaging.h"
#include "host/plan/Library.h"
#include "host/plan/LibraryReader.h"
#include "host/plan/RestoredParts.h"
#include "host/plan/StagingArea.h"
#include "host/plan/StandingInstalls.h"
#include "host/session/Interruption.h"
#include "host/session/Parcels.h"
#include "host/session/PlugIn.h"
#include "host/session/Session.h"
#include "host/session/StopSignals.h"
#include "host/session/StoreDelivery.h"
#include "host/session/SyncOutcome.h"
#include "host/watch/SessionFacts.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/Platform.h"

namespace appsync {
namespace {

using Clock = std::chrono::steady_clock;

Status checkArguments(const SendArguments& arguments) {
    const Status legal = checkIdentifier(arguments.identifier, kUseLegalCharacters);
    if (!legal) return legal;
    const unsigned parts = arguments.parts.value_or(kAssetPartApplication);
    if (!arguments.isRestore && parts != kAssetPartApplication) {
        return wrongUsage("--parts " + std::to_string(parts) + " without --restore",
                          "only a restore comes in parts");
    }
    return {};
}

class Sending {
  public:
    /// Without a sink the session is not recorded.
    Sending(const SendArguments& arguments, const PlugInModule& module, RecordingSink* recording,
            const Console& console)
        : arguments_(arguments),
          module_(module),
          recording_{recording, arguments.recording.isAnonymous},
          console_(console),
          display_(makeSyncDisplay(arguments.display, console, arguments.isVerbose)),
          events_(*display_),
          signals_(
              kPatience, [this] { events_.complainSoon(stoppingNotice()); }, [this] { leave(); }) {
        events_.tellOfTime();
    }
    Sending(const Sending&) = delete;
    Sending& operator=(const Sending&) = delete;
    // Signals must not end the process in an instant before the device is closed.
    ~Sending() { device_.reset(); }

    Result<int> run() {
        events_.doing("opening the device");
        Result<int> status = attempt();
        if (!status) events_.closeSoon();
        return status;
    }

  private:
    Result<int> attempt() {
        Result<std::unique_ptr<Device>> device =
            Device::open(arguments_.device, {DeviceAccess::Session});
        if (!device) return unusable(device.error());
        device_ = *std::move(device);
        const Result<DeviceSettings> settings = device_->settings();
        if (!settings) return unusable(settings.error());
        if (settings->installation == PolicyAnswer::No) return refuse(installationForbidden());
        isCoordinated_ = settings->coordination;
        Status ready = decideParts();
        if (ready) ready = checkFile();
        if (ready) ready = checkSpace();
        if (!ready) return refuse(ready.error());
        if (isCoordinated_) ready = checkCoordinated();
        if (ready && !isData()) ready = checkPackage();
        if (ready) ready = isData() ? prepareData() : preparePackage();
        if (ready) ready = clearTheWay();
        if (!ready) return refuse(ready.error());
        isPlanned_ = true;
        if (signals_.stopRequested()) return finish(summarizeInterrupted(plan_, facts_));
        return hold();
    }

    [[nodiscard]] bool isData() const { return parts_ == kAssetPartApplicationData; }

    [[nodiscard]] ParcelContents contents() const {
        return {arguments_.identifier, arguments_.file, isRestore_, parts_};
    }

    Status decideParts() {
        if (!isRestore_ || arguments_.parts) return {};
        const Result<unsigned> parts = partsOfRestored(*device_, arguments_.identifier);
        if (!parts) return unusable(parts.error());
        parts_ = *parts;
        // Where installs are coordinated, what waits for nothing is a package like any other.
        if (isCoordinated_) isRestore_ = parts_ == kAssetPartApplication;
        return {};
    }

    // A plug-in that coordinates its installs takes only what it has asked for: the package travels
    // in a session with a staging area of its own.
    Status checkCoordinated() {
        if (isRestore_) {
            return failure(
                "the installs of this device are coordinated, and restored packages "
                "are the store's to bring",
                "see appsync store, or turn coordination off");
        }
        const Result<ApplicationStatus> status = device_->status(arguments_.identifier);
        if (!status) return unusable(status.error());
        if (status->placeholder && isOffloadedSystemApplication(*status->placeholder)) {
            offloaded_ = status->placeholder;
            return {};
        }
        if (status->coordinator && status->coordinator->restores()) {
            return failure("a restore brought " + arguments_.identifier +
                               " back, and its package is the store's to bring",
                           "see appsync store");
        }
        return checkStagedWork();
    }

    // This session's own staging area would take the place of the host's.
    Status checkStagedWork() const {
        const StagedWork work = stagedWorkOn(*device_);
        if (work == StagedWork::None) return {};
        return failure(work == StagedWork::Waiting
                           ? "a host has left a staging area on the device"
                           : "an interrupted sync --staged has left something to do on the device",
                       "take it over first (appsync sync DEVICE LIBRARY --staged)");
    }

    // Only what an earlier session has left of this application; the others go on.
    Status clearTheWay() {
        const Result<std::vector<ApplicationRecord>> present = device_->applications();
        if (!present) return unusable(present.error());
        const Result<std::vector<CoordinatorRecord>> coordinators = device_->coordinators();
        if (!coordinators) return unusable(coordinators.error());
        StandingRules rules;
        rules.leavesOthers = true;
        rules.arrivedVersion = [this](const std::string& identifier) {
            return versionOfArrived(*device_, identifier);
        };
        standing_ = takeUp(plan_, *coordinators, *present, rules);
        std::erase_if(standing_.obsolete, [this](const std::string& identifier) {
            return identifier != arguments_.identifier;
        });
        Status status = cancelObsolete(*device_, standing_);
        if (!status) return unusable(status.error());
        status = removeStaleTransfers(*device_, standing_.arrived);
        if (status && isCoordinated_ && !offloaded_)
            status = writeStagingArea(*device_, plan_, library_);
        return status;
    }

    SessionEnd holdSession(Session& session, InstallCoordinatorService& service) {
        // The plug-in never asks for an application of the system, so it comes as the store's do.
        if (offloaded_) return holdAsStore(service);
        if (!isCoordinated_) return session.deliver(parcel_);
        return session.sync(
            {[this](const std::string&) { return Result<std::string>(arguments_.file); },
             [this](const std::string& identifier) {
                 return identifier == arguments_.identifier &&
                        !standing_.arrived.contains(identifier);
             },
             false});
    }

    SessionEnd holdAsStore(InstallCoordinatorService& service) {
        if (plan_.install.empty()) {  // another client has it in hand
            facts_.reconciled();
            return {};
        }
        const bool hasArrived = standing_.arrived.contains(arguments_.identifier);
        return bringBack(*device_, service, *offloaded_,
                         hasArrived ? nullptr : &library_.packages.front(), facts_,
                         [this] { return signals_.stopRequested().load(); });
    }

    Status checkFile() const {
        const Result<HostFile> file = HostFile::open(arguments_.file);
        return file ? Status() : Status(file.error());
    }

    // What cannot be looked at here is told by whoever uses it.
    Status checkSpace() const {
        std::error_code code;
        std::uint64_t needed = std::filesystem::file_size(arguments_.file, code);
        const Result<std::uint64_t> free = device_->freeSpace();
        if (code || !free) return {};
        if (!isData()) {
            const Result<PackageReader> package =
                PackageReader::open(arguments_.file, device_->propertyLists());
            if (package) needed += bytesOnDevice(package->info());
        }
        if (needed > *free) return lackOfSpace("it", needed, *free, "free space on the device");
        device_->makeRoom(needed);
        return {};
    }

    // Nothing is sent. A device that cannot be used is an error, not a failure of this package.
    Result<int> refuse(const ErrorRecord& cause) {
        const ErrorRecord reason = classified(cause);
        if (exitStatusOf(reason) == kExitUnusable) return reason;
        SyncSummary summary;
        summary.failed.push_back({arguments_.identifier, reason.description()});
        summary.incomplete = true;
        return finish(std::move(summary));
    }

    // Nobody has asked for it, so what the device would refuse is not sent.
    Status checkPackage() const {
        return verifyPackage(arguments_.file, arguments_.identifier, device_->propertyLists());
    }

    Status preparePackage() {
        const Result<PackageReader> package =
            PackageReader::open(arguments_.file, device_->propertyLists());
        const std::string version = package ? package->info().version : "";
        parcel_ = packageParcel(contents(), version);
        PlannedInstall planned{arguments_.identifier, {}, {}, {}, 0, 0};
        if (package) planned.newVersion = version;
        if (package && package->info().identifier == arguments_.identifier) {
            library_.packages.push_back({arguments_.identifier, version,
                                         package->info().displayName, arguments_.file,
                                         package->info().packedBytes, 0});
        }
        if (isRestore_ && parts_ == kAssetPartApplication) {
            plansInstall_ = false;  // it waits for the data that is still to come
        }
        return planInstall(std::move(planned));
    }

    Status prepareData() {
        const std::optional<std::string> version =
            versionThatWaitsForData(*device_, arguments_.identifier);
        if (!version) {
            return failure("no package of " + arguments_.identifier + " waits for its data",
                           "send the package first, with --restore --parts 1");
        }
        if (const Status harmless = refuseToLoseData(); !harmless) return harmless;
        Result<Session::Parcel> parcel = dataParcel(contents(), *version);
        if (!parcel) return parcel.error();
        parcel_ = *std::move(parcel);
        return planInstall({arguments_.identifier, {}, {}, *version, 0, 0});
    }

    // What a restore brings back has no data but the backup's; an application that stands has its
    // own.
    [[nodiscard]] Status refuseToLoseData() const {
        const std::string& identifier = arguments_.identifier;
        if (arguments_.yes) return {};
        const Result<ApplicationStatus> status = device_->status(identifier);
        if (!status) return unusable(status.error());
        if (!status->installed) return {};
        const Result<DataContents> data = listData(device_->root(), Device::dataPath(identifier));
        if (!data) return data.error();
        if (data->entries.empty() && data->leftOut.empty()) return {};
        return failure(identifier + " is installed and has data on the device",
                       "give --yes to replace it; appsync data pull keeps it");
    }

    Status planInstall(PlannedInstall planned) {
        if (isRestore_ && !isData()) {
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
        Result<std::unique_ptr<PlugIn>> plugIn =
            PlugIn::load(*device_, events_, facts_, console_, module_.table(), recording_);
        if (!plugIn) return plugIn.error();
        std::error_code code;
        const std::uint64_t bytes = std::filesystem::file_size(arguments_.file, code);
        events_.expect({1, code ? 0 : bytes});
        Session session(*device_, **plugIn, events_, facts_, signals_.stopRequested());
        const SessionEnd end = holdSession(session, (*plugIn)->platform().coordination);
        const Result<SessionAftermath> aftermath = aftermathOf(*device_, end, facts_);
        if (!aftermath) {
            finish(summarizeFailed(plan_, facts_, aftermath.error()));
            return int{exitStatusOf(aftermath.error())};
        }
        SyncSummary summary = summarize(plan_, facts_, *aftermath);
        if (!plansInstall_ && summary.failed.empty()) {
            summary.skipped.push_back({arguments_.identifier,
                                       "its package waits for its data: " +
                                           howRestoredDataComes(arguments_.identifier, true),
                                       false});
        }
        return finish(std::move(summary));
    }

    // On the thread of the signals, whatever the session is at.
    [[noreturn]] void leave() {
        if (!isPlanned_) leaveAtOnce(console_);
        const SyncSummary summary = timed(summarizeInterrupted(plan_, facts_));
        const bool isTold = events_.finishSoon(summary);
        if (!isTold || summary.failed.empty()) leaveAtOnce(console_);
        ::_exit(kExitSomethingFailed);
    }

    SyncSummary timed(SyncSummary summary) const {
        summary.seconds = std::chrono::duration<double>(Clock::now() - begin_).count();
        return summary;
    }

    int finish(SyncSummary summary) {
        summary = timed(std::move(summary));
        events_.finish(summary);
        if (signals_.stopRequested() && !tellsOfInterruption(summary)) {
            console_.fail(failure("interrupted", kRunAgain));
        }
        return summary.incomplete ? kExitSomethingFailed : kExitDone;
    }

    const SendArguments& arguments_;
    const PlugInModule& module_;
    const RecordingOrder recording_;
    const Console& console_;
    std::unique_ptr<SyncDisplay> display_;
    SyncEvents events_;
    SessionFacts facts_;
    std::unique_ptr<Device> device_;
    Session::Parcel parcel_;
    SyncPlan plan_;
    Library library_;  // the one package
    StandingInstalls standing_;
    bool isCoordinated_ = false;
    bool isRestore_ = arguments_.isRestore;
    unsigned parts_ = arguments_.parts.value_or(kAssetPartApplication);
    std::optional<ApplicationRecord> offloaded_;  // only an application of the system
    bool plansInstall_ = true;
    const Clock::time_point begin_ = Clock::now();
    std::atomic<bool> isPlanned_ = false;  // the plan is made, and changes no more
    const StopSignals signals_;
};

}  // namespace

int runSend(const SendArguments& arguments, const Console& console) {
    const Status checked = checkArguments(arguments);
    if (!checked) return console.fail(checked.error());
    const Result<PlugInModule> build = PlugInModule::open(arguments.plugIn);
    if (!build) return console.fail(build.error());
    const Result<std::unique_ptr<RecordingFile>> recording = createRecording(arguments.recording);
    if (!recording) return console.fail(recording.error());
    const Result<int> status = Sending(arguments, *build, recording->get(), console).run();
    if (*recording != nullptr) (*recording)->tellLoss(console);
    return status ? *status : console.fail(status.error());
}

}  // namespace appsync
