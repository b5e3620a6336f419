#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <optional>
#include <ostream>
#include <set>
#include <utility>

#include "device/Device.h"
#include "host/command/Commands.h"
#include "host/command/IdentifierArgument.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/output/Json.h"
#include "host/output/PlanText.h"
#include "host/plan/InterruptedStaging.h"
#include "host/plan/LibraryReader.h"
#include "host/plan/StagingArea.h"
#include "host/plan/StandingInstalls.h"
#include "host/session/Interruption.h"
#include "host/session/PlugIn.h"
#include "host/session/Session.h"
#include "host/session/SessionFacts.h"
#include "host/session/SessionWatch.h"
#include "host/session/StopSignals.h"
#include "host/session/SyncOutcome.h"

namespace appsync {
namespace {

using Clock = std::chrono::steady_clock;

Status checkArguments(const SyncArguments& arguments) {
    if (arguments.isStaged && (arguments.plan.mirror || !arguments.plan.remove.empty())) {
        return wrongUsage("--staged goes with neither --remove nor --mirror",
                          "the staging area says what to remove");
    }
    for (const std::string& identifier : arguments.plan.remove) {
        if (Status legal = checkIdentifier(identifier, kGiveAsShown, "--remove"); !legal) {
            return legal;
        }
    }
    return {};
}

// What the host staged for another session is not this one's to do.
std::string givenUpNote(StagedWork work) {
    const std::string what = work == StagedWork::Waiting
                                 ? "the staging area that waits on the device"
                                 : "what an interrupted sync --staged has left to do";
    return what + " is given up for this sync: stage it again afterwards";
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
    ~SyncRun() {
        while (isDeviceTaken_.test_and_set()) ::pause();  // the process is about to end
        device_.reset();
    }

    Result<int> run() {
        Status ready = prepare();
        if (!ready) return ready.error();
        if (arguments_.isDryRun) return showPlan();
        isPlanned_ = true;
        if (mustNotRun_) return refuse(plan_.failed.back().error);
        if (!space_.fits()) return refuse(space_.description());
        if (givenUp_ != StagedWork::None) console_.complain(givenUpNote(givenUp_));
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
        const PlanOptions& plan = arguments_.plan;
        options.makesRoom = !arguments_.isDryRun && (plan.mirror || !plan.remove.empty());
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
        const Result<std::vector<ApplicationRecord>> present = device_->applicationsOnDisk();
        if (!present) return unusable(present.error());
        const Result<DeviceSettings> settings = device_->settings();
        if (!settings) return unusable(settings.error());
        if (arguments_.isStaged) {
            planStaged(*present, *settings);
        } else {
            PlanOptions options = arguments_.plan;
            options.bringsOffloaded = settings->coordination;
            plan_ = makePlan(library_, *present, options);
            givenUp_ = stagedWorkOn(*device_);
            const bool isToNote = arguments_.isDryRun && givenUp_ != StagedWork::None;
            if (isToNote) plan_.notes.push_back(givenUpNote(givenUp_));  // a sync complains of it
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

    void planStaged(const std::vector<ApplicationRecord>& present, const DeviceSettings& settings) {
        staged_ = readStagedTodoList(*device_);
        StagedPlanOptions options;
        options.bringsOffloaded = settings.coordination;
        options.packageOf = [this](const std::string& identifier) {
            return packageFor(library_, identifier, device_->propertyLists());
        };
        plan_ = makeStagedPlan(staged_.list, present, options);
        plan_.notes = library_.notes;
        if (staged_.isTakenUp) {
            plan_.notes.emplace_back("this takes up the session that was interrupted");
        }
        mustNotRun_ = staged_.isTooLarge;
        if (staged_.error) {
            plan_.failed.push_back(
                {"ApplicationsSync.plist",
                 "the todo list of the staging area cannot be used: " + *staged_.error +
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
        if (status) status = stage();
        if (status) return {};
        return unusable(status.error().withContext("cannot prepare the device for the sync"));
    }

    Status stage() {
        if (!arguments_.isStaged) return writeStagingArea(*device_, plan_, library_);
        if (staged_.isTakenUp) {
            const Status again = stageAgain(*device_, staged_.list, plan_);
            if (!again) return again;
        }
        // Where it cannot be noted, as in an area that is a link, an interruption is final.
        if (staged_.list.isArray()) {
            beginStagedSession(*device_, std::exchange(staged_.list, {})).ignore();
        }
        return {};
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
            {[this](const std::string& identifier) { return packageFileFor(library_, identifier); },
             [this](const std::string& identifier) {
                 return !standing_.arrived.contains(identifier);
             }});
        if (arguments_.isStaged && end.isSuccess()) {
            isStagingOver_ = true;
            endStagedSession(*device_);
        }
        Result<SessionAftermath> aftermath = aftermathOf(*device_, end, facts_);
        if (aftermath) {
            if (end.isSuccess()) forgetFailures(aftermath->present);
            return finish(summarize(plan_, facts_, *aftermath));
        }
        finish(summarizeFailed(plan_, facts_, aftermath.error()));
        return aftermath.error();
    }

    // What is in step with the library, an earlier update may have failed of.
    void forgetFailures(const std::vector<ApplicationRecord>& present) {
        if (arguments_.isStaged) return;
        std::set<std::string> inStep;
        for (const ApplicationRecord& each : present) {
            const LibraryPackage* package = library_.find(each.identifier);
            const bool isSame = !each.isPlaceholder && package != nullptr &&
                                package->version == each.version.value_or("");
            if (isSame) inStep.insert(each.identifier);
        }
        device_->forgetFailures(inStep).ignore();
    }

    // On the thread of the signals, whatever the session is at. From here on the plan stays as it
    // is. What the session has said at its end comes before what is said here.
    [[noreturn]] void leave() {
        if (!isPlanned_) leaveAtOnce(console_);
        const SyncSummary summary = timed(summaryOnLeaving());
        events_.finishSoon(summary);
        if (const int status = endedWith_; status >= 0) ::_exit(status);
        if (!summary.incomplete) ::_exit(kExitDone);
        if (isStagingOver_) ::_exit(kExitSomethingFailed);
        leaveAtOnce(console_);
    }

    SyncSummary summaryOnLeaving() {
        if (isDeviceTaken_.test_and_set()) return summarizeInterrupted(plan_, facts_);
        const Result<SessionAftermath> aftermath = aftermathOnLeaving(*device_, facts_);
        return aftermath ? summarize(plan_, facts_, *aftermath)
                         : summarizeInterrupted(plan_, facts_);
    }

    SyncSummary timed(SyncSummary summary) const {
        summary.seconds = std::chrono::duration<double>(Clock::now() - begin_).count();
        summary.incomplete = summary.incomplete || !summary.failed.empty();
        return summary;
    }

    int finish(SyncSummary summary) {
        summary = timed(std::move(summary));
        if (arguments_.display == SyncDisplayKind::Text) {
            for (const std::string& note : plan_.notes) console_.out << printable(note) << '\n';
        }
        endedWith_ = summary.incomplete ? kExitSomethingFailed : kExitDone;
        events_.finish(summary);
        const bool isInterrupted =
            summary.incomplete && signals_->stopRequested() && !isStagingOver_;
        if (isInterrupted) console_.fail(failure("interrupted", kRunAgain));
        return endedWith_;
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
    StagedTodoList staged_;                  // only with --staged, until the session begins
    StagedWork givenUp_ = StagedWork::None;  // only without
    SpaceCheck space_;
    bool mustNotRun_ = false;
    const Clock::time_point begin_ = Clock::now();
    std::atomic<bool> isPlanned_ = false;  // the plan is made, and changes no more
    // What is left of a staging area whose session has ended, the same command does not do.
    std::atomic<bool> isStagingOver_ = false;
    std::atomic<int> endedWith_ = -1;     // the status that the session's own end has found
    std::atomic_flag isDeviceTaken_;      // by whoever closes the device, or leaves it
    std::optional<StopSignals> signals_;  // not for a dry run
};

}  // namespace

int runSync(const SyncArguments& arguments, const Console& console) {
    const Status checked = checkArguments(arguments);
    if (!checked) return console.fail(checked.error());
    const Result<int> status = SyncRun(arguments, console).run();
    return status ? *status : console.fail(status.error());
}

}  // namespace appsync
