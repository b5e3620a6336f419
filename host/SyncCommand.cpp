#include <algorithm>
#include <atomic>
#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <ostream>
#include <system_error>
#include <utility>

#include "device/Device.h"
#include "device/PackageIdentifier.h"
#include "host/Commands.h"
#include "host/Console.h"
#include "host/Interruption.h"
#include "host/Json.h"
#include "host/LibraryReader.h"
#include "host/PlanText.h"
#include "host/PlugIn.h"
#include "host/Problem.h"
#include "host/Session.h"
#include "host/SessionFacts.h"
#include "host/SessionWatch.h"
#include "host/StagingArea.h"
#include "host/StandingInstalls.h"
#include "host/StopSignals.h"
#include "host/SyncOutcome.h"
#include "host/Text.h"

namespace appsync {
namespace {

using Clock = std::chrono::steady_clock;

Status checkArguments(const SyncArguments& arguments) {
    if (arguments.isStaged && (arguments.plan.mirror || !arguments.plan.remove.empty())) {
        return wrongUsage("--staged goes with neither --remove nor --mirror",
                          "the staging area says what to remove");
    }
    for (const std::string& identifier : arguments.plan.remove) {
        if (isLegalIdentifier(identifier)) continue;
        return wrongUsage("--remove " + identifier + " is not an identifier",
                          "give one as appsync apps shows it");
    }
    return {};
}

// The package that the library has for an identifier; else the file that is named for it, which the
// device then judges.
Result<std::string> packageFile(const Library& library, const std::string& identifier) {
    if (const LibraryPackage* package = library.find(identifier)) return package->file;
    std::string file = library.folder + "/" + identifier + ".zip";
    std::error_code code;
    if (std::filesystem::exists(file, code)) return file;
    return ErrorRecord::make(
        kTransferErrorDomain, kTransferNoPackage,
        "the library has no package of " + identifier + ": put one into " + library.folder);
}

// One run of `sync` or `plan`.
class SyncRun {
  public:
    SyncRun(const SyncArguments& arguments, const Console& console)
        : arguments_(arguments),
          console_(console),
          display_(makeSyncDisplay(arguments.display, console)),
          events_(*display_) {
        if (arguments.isDryRun) return;
        signals_.emplace(
            kPatience, [this] { events_.complainSoon(stoppingNotice()); }, [this] { leave(); });
    }
    SyncRun(const SyncRun&) = delete;
    SyncRun& operator=(const SyncRun&) = delete;
    // Signals must not end the process in an instant before the device is closed.
    ~SyncRun() { device_.reset(); }

    Result<int> run() {
        Status ready = prepare();
        if (!ready) return ready.error();
        if (arguments_.isDryRun) return showPlan();
        isPlanned_ = true;
        if (mustNotRun_) return refuse(plan_.failed.back().error);
        if (!space_.fits()) return refuse(space_.description());
        ready = clearTheWay();
        if (!ready) return ready.error();
        if (signals_->stopRequested()) return finish(summarizeInterrupted(plan_, facts_));
        return hold();
    }

  private:
    Status prepare() {
        Status status = openDevice();
        if (status) status = openLibrary();
        if (status) status = makeThePlan();
        if (status) status = checkSpace();
        return status;
    }

    Status openDevice() {
        DeviceOpenOptions options;
        options.access = arguments_.isDryRun ? DeviceAccess::Look : DeviceAccess::Session;
        Result<std::unique_ptr<Device>> device = Device::open(arguments_.device, options);
        if (!device) return unusable(device.error());
        device_ = *std::move(device);
        return {};
    }

    Status openLibrary() {
        Result<Library> library = readLibrary(arguments_.library, device_->propertyLists());
        if (!library) return library.error();
        library_ = *std::move(library);
        return {};
    }

    Status makeThePlan() {
        const Result<std::vector<ApplicationRecord>> present = device_->applications();
        if (!present) return unusable(present.error());
        const Result<DeviceSettings> settings = device_->settings();
        if (!settings) return unusable(settings.error());
        if (arguments_.isStaged) {
            planStaged(*present);
        } else {
            PlanOptions options = arguments_.plan;
            options.bringsOffloaded = settings->coordination;
            plan_ = makePlan(library_, *present, options);
        }
        if (!settings->coordination) return {};  // a session begins by dropping what stands
        const Result<std::vector<CoordinatorRecord>> coordinators = device_->coordinators();
        if (!coordinators) return unusable(coordinators.error());
        standing_ = takeUp(plan_, *coordinators, *present, standingRules(*settings));
        return {};
    }

    // What cannot be read in a mirrored library may be the package of any application.
    [[nodiscard]] StandingRules standingRules(const DeviceSettings& settings) const {
        StandingRules rules;
        rules.isForbidden = settings.installation == PolicyAnswer::No;
        if (!arguments_.plan.mirror || !library_.faults.empty()) return rules;
        rules.isUnwanted = [this](const std::string& identifier) {
            return library_.find(identifier) == nullptr;
        };
        return rules;
    }

    void planStaged(const std::vector<ApplicationRecord>& present) {
        const StagedTodoList staged = readStagedTodoList(*device_);
        plan_ = makeStagedPlan(staged.list, library_, present);
        mustNotRun_ = staged.isTooLarge;
        if (staged.error) {
            plan_.failed.push_back(
                {"ApplicationsSync.plist",
                 "the todo list of the staging area cannot be used: " + *staged.error +
                     (mustNotRun_ ? "; split it, nothing was done"
                                  : "; write the staging area anew")});
        }
    }

    Status checkSpace() {
        const Result<std::uint64_t> free = device_->freeSpace();
        if (!free) return unusable(free.error());
        const Result<DeviceSettings> settings = device_->settings();
        if (!settings) return unusable(settings.error());
        allowed_ = allowedBy(*settings, plan_);
        space_ = {allowed_.needed(), *free, allowed_.reclaimed};
        return {};
    }

    int showPlan() const {
        if (arguments_.display == SyncDisplayKind::Text) {
            console_.out << planText(allowed_, space_) << std::flush;
        } else {
            const JsonLayout layout = arguments_.display == SyncDisplayKind::Json
                                          ? JsonLayout::Indented
                                          : JsonLayout::EventLine;
            console_.out << jsonText(allowed_, space_, layout) << '\n' << std::flush;
        }
        if (!space_.fits()) console_.complain(space_.description());
        return space_.fits() && allowed_.failed.empty() ? kExitDone : kExitSomethingFailed;
    }

    // Nothing of the plan is done, for one reason.
    int refuse(const std::string& reason) {
        SyncSummary summary;
        summary.failed = allowed_.failed;
        summary.skipped = allowed_.skipped;
        for (const auto* installs : {&allowed_.install, &allowed_.update}) {
            for (const PlannedInstall& each : *installs) {
                summary.failed.push_back({each.identifier, reason});
            }
        }
        for (const std::string& identifier : allowed_.remove) {
            summary.failed.push_back({identifier, "nothing is done: " + reason});
        }
        console_.complain(reason);
        return finish(std::move(summary));
    }

    Status clearTheWay() {
        Status status = cancelObsolete(*device_, standing_);
        if (!status) return unusable(status.error());
        const Result<std::vector<std::string>> placeholders =
            device_->removeLeftoverSyncPlaceholders();
        if (!placeholders) return unusable(placeholders.error());
        status = removeStaleTransfers(*device_, standing_.arrived);
        if (status && !arguments_.isStaged) status = writeStagingArea(*device_, plan_, library_);
        if (status) return {};
        return unusable(status.error().withContext("cannot prepare the device for the sync"));
    }

    Result<int> hold() {
        Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(*device_, events_, facts_);
        if (!plugIn) return plugIn.error();
        for (const auto* installs : {&plan_.install, &plan_.update}) {
            for (const PlannedInstall& each : *installs) {
                if (each.hasArrived) (*plugIn)->watch().setSize(each.identifier, each.bytes);
            }
        }
        Session session(*device_, **plugIn, events_, facts_, signals_->stopRequested());
        const SessionEnd end = session.sync(
            {[this](const std::string& identifier) { return packageFile(library_, identifier); },
             [this](const std::string& identifier) {
                 return !standing_.arrived.contains(identifier);
             }});
        Result<SessionAftermath> aftermath = aftermathOf(*device_, end, facts_);
        if (aftermath) return finish(summarize(plan_, facts_, *aftermath));
        finish(summarizeFailed(plan_, facts_, aftermath.error()));
        return aftermath.error();
    }

    // On the thread of the signals, whatever the session is at. From here on the plan stays as it
    // is, and the device is not asked: it may be what does not answer.
    [[noreturn]] void leave() {
        if (isPlanned_) events_.finishSoon(timed(summarizeInterrupted(plan_, facts_)));
        leaveAtOnce(console_);
    }

    SyncSummary timed(SyncSummary summary) const {
        summary.seconds = std::chrono::duration<double>(Clock::now() - begin_).count();
        summary.incomplete = summary.incomplete || !summary.failed.empty();
        return summary;
    }

    int finish(SyncSummary summary) {
        summary = timed(std::move(summary));
        if (arguments_.display == SyncDisplayKind::Text) {
            for (const std::string& note : library_.notes) console_.out << printable(note) << '\n';
        }
        events_.finish(summary);
        if (signals_->stopRequested()) console_.fail(failure("interrupted", kRunAgain));
        return summary.incomplete ? kExitSomethingFailed : kExitDone;
    }

    const SyncArguments& arguments_;
    const Console& console_;
    std::unique_ptr<SyncDisplay> display_;
    SyncEvents events_;
    SessionFacts facts_;
    std::unique_ptr<Device> device_;
    Library library_;
    SyncPlan plan_;
    SyncPlan allowed_;  // what of it policy lets happen
    StandingInstalls standing_;
    SpaceCheck space_;
    bool mustNotRun_ = false;
    const Clock::time_point begin_ = Clock::now();
    std::atomic<bool> isPlanned_ = false;  // the plan is made, and changes no more
    std::optional<StopSignals> signals_;   // not for a dry run
};

}  // namespace

int runSync(const SyncArguments& arguments, const Console& console) {
    const Status checked = checkArguments(arguments);
    if (!checked) return console.fail(checked.error());
    const Result<int> status = SyncRun(arguments, console).run();
    return status ? *status : console.fail(status.error());
}

}  // namespace appsync
