#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <map>
#include <memory>
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "device/Device.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/sync/SyncCommands.h"
#include "host/command/sync/SyncSource.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/module/PlugInModule.h"
#include "host/output/JsonSync.h"
#include "host/output/PlanText.h"
#include "host/plan/LibraryReader.h"
#include "host/plan/SyncPreparation.h"
#include "host/plan/TransferError.h"
#include "host/session/Interruption.h"
#include "host/session/PlugIn.h"
#include "host/session/Session.h"
#include "host/session/StopSignals.h"
#include "host/session/SyncOutcome.h"
#include "host/watch/PreparationEvents.h"
#include "host/watch/SessionFacts.h"
#include "host/watch/SessionWatch.h"

namespace appsync {
namespace {

using Clock = std::chrono::steady_clock;

// What a plan prints is the plan: only a terminal, which takes it away again, shows more.
bool showsPreparation(const SyncArguments& arguments, const Console& console) {
    return !arguments.isDryRun ||
           (arguments.display == SyncDisplayKind::Text && console.isTerminal);
}

// What the host staged for another session is not this one's to do.
std::string givenUpNote(StagedWork work) {
    const std::string what = work == StagedWork::Waiting
                                 ? "the staging area that waits on the device"
                                 : "what an interrupted sync --staged has left to do";
    return what + " is given up for this sync: stage it again afterwards";
}

SyncTotals totalsOf(const SyncPlan& plan) {
    return {plan.install.size() + plan.update.size() + plan.remove.size(), plan.bytes()};
}

std::map<std::string, std::string> refusalsOf(const SyncPlan& plan) {
    std::map<std::string, std::string> refusals;
    for (const PlannedInstall& each : plan.update) {
        if (!each.refusal.empty()) refusals[each.identifier] = each.refusal;
    }
    return refusals;
}

ErrorRecord refusalOfTransfer(const std::string& why) {
    return ErrorRecord::make(kTransferErrorDomain, kTransferNoPackage, why);
}

std::string usedUpWarning(const SyncPreparation& sync) {
    return "device policy leaves " + counted(sync.forbidden, "application") +
           " of the staging area alone, and this session takes the area away: allow that (appsync "
           "set DEVICE " +
           sync.permission + "), and stage it again";
}

std::string staysWarning(const SyncPreparation& sync) {
    return "nothing of what the staging area asks for is allowed by device policy, so it stays "
           "there: allow that (appsync set DEVICE " +
           sync.permission + "), and run the same command again";
}

// One run of `sync` or `plan`.
class SyncRun {
  public:
    /// Without a sink the session is not recorded.
    SyncRun(const SyncArguments& arguments, const PlugInModule& module, RecordingSink* recording,
            const Console& console)
        : arguments_(arguments),
          module_(module),
          recording_{recording, arguments.recording.isAnonymous},
          console_(console),
          display_(makeSyncDisplay(arguments.display, console, arguments.isVerbose)),
          events_(*display_),
          preparation_(showsPreparation(arguments, console) ? &events_ : nullptr) {
        if (!arguments.isDryRun) {
            signals_.emplace(
                kPatience, [this] { events_.complainSoon(stoppingNotice()); }, [this] { leave(); });
        }
        events_.tellOfTime();
    }
    SyncRun(const SyncRun&) = delete;
    SyncRun& operator=(const SyncRun&) = delete;
    // Signals must not end the process in an instant before the device is closed.
    ~SyncRun() {
        while (isDeviceTaken_.test_and_set()) ::pause();  // the process is about to end
        device_.reset();
    }

    Result<int> run() {
        Result<int> status = attempt();
        if (status) return status;
        preparation_.fail(status.error().description());
        events_.closeSoon();
        return status;
    }

  private:
    Result<int> attempt() {
        Status ready = prepare();
        if (!ready) return ready.error();
        if (arguments_.isDryRun) return showPlan();
        isPlanned_ = true;
        if (sync_.staged.isTooLarge) return refuse(sync_.plan.failed.back().error);
        if (!sync_.space.fits()) return refuse(sync_.space.description());
        if (sync_.givenUp != StagedWork::None) events_.complainSoon(givenUpNote(sync_.givenUp));
        for (const std::string& each : sync_.plan.warnings) events_.complainSoon(each);
        if (arguments_.isStaged && sync_.forbidden > 0) {
            if (sync_.allowed.empty()) return leaveStaged();
            events_.complainSoon(usedUpWarning(sync_));
        }
        events_.expect(totalsOf(sync_.allowed));
        events_.doing("preparing the device");
        ready = makeReady();
        if (!ready) return ready.error();
        if (!signals_->stopRequested()) return hold();
        preparation_.fail("interrupted");
        return finish(summarizeInterrupted(sync_.plan, facts_));
    }

    Status prepare() {
        events_.doing("opening the device");
        Status status = openDevice();
        if (status) status = openLibrary();
        events_.doing("planning");
        if (status) status = makeThePlan();
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
        Result<Library> library = readSyncLibrary(
            arguments_, device_->propertyLists(),
            [this](std::size_t done, std::size_t count) { preparation_.read(done, count); });
        if (!library) return library.error();
        library_ = *std::move(library);
        return {};
    }

    Status makeThePlan() {
        Result<SyncPreparation> sync = arguments_.isStaged
                                           ? prepareStagedSync(*device_, library_)
                                           : prepareSync(*device_, library_, arguments_.plan);
        if (!sync) return sync.error();
        sync_ = *std::move(sync);
        return {};
    }

    int showPlan() {
        preparation_.finish();
        events_.closeSoon();
        if (sync_.givenUp != StagedWork::None) {
            sync_.allowed.notes.push_back(givenUpNote(sync_.givenUp));
        }
        for (const std::string& each : sync_.plan.warnings) sync_.allowed.notes.push_back(each);
        if (arguments_.display == SyncDisplayKind::Text) {
            console_.out << planText(sync_.allowed, sync_.space) << std::flush;
        } else {
            const JsonLayout layout = arguments_.display == SyncDisplayKind::Json
                                          ? JsonLayout::Indented
                                          : JsonLayout::EventLine;
            console_.out << jsonText(sync_.allowed, sync_.space, layout) << '\n' << std::flush;
        }
        if (!sync_.space.fits()) console_.complain(sync_.space.description());
        return sync_.space.fits() && sync_.allowed.failed.empty() ? kExitDone
                                                                  : kExitSomethingFailed;
    }

    // Nothing of the plan is done, for one reason.
    int refuse(const std::string& reason) {
        preparation_.fail(reason);
        return finish(summarizeRefused(sync_.allowed, reason));
    }

    // What policy may allow later is not used up by a session that does nothing.
    int leaveStaged() {
        const std::string why = "device policy allows nothing of it";
        preparation_.fail(why);
        events_.complainSoon(staysWarning(sync_));
        return finish(summarizeRefused(sync_.allowed, why));
    }

    Status makeReady() {
        if (arguments_.isStaged) return clearTheWayForStaged(*device_, sync_);
        return clearTheWay(*device_, sync_, library_, [this](std::size_t done, std::size_t count) {
            preparation_.staged(done, count);
        });
    }

    Result<int> hold() {
        Result<std::unique_ptr<PlugIn>> plugIn =
            PlugIn::load(*device_, events_, facts_, console_, module_.table(), recording_);
        if (!plugIn) return plugIn.error();
        watchOver((*plugIn)->watch());
        for (const auto* installs : {&sync_.plan.install, &sync_.plan.update}) {
            for (const PlannedInstall& each : *installs) {
                if (each.hasArrived) (*plugIn)->watch().setSize(each.identifier, each.bytes);
            }
        }
        Session session(*device_, **plugIn, events_, facts_, signals_->stopRequested());
        const std::map<std::string, std::string> refusals = refusalsOf(sync_.plan);
        const SessionEnd end =
            session.sync({[&](const std::string& identifier) -> Result<std::string> {
                              const auto refused = refusals.find(identifier);
                              if (refused == refusals.end())
                                  return packageFileFor(library_, identifier);
                              return refusalOfTransfer(refused->second);
                          },
                          [this](const std::string& identifier) {
                              return !sync_.standing.arrived.contains(identifier);
                          },
                          true, [this] { preparation_.finish(); }});
        if (end.error) {
            preparation_.fail(end.error->description());
        } else {
            preparation_.finish();
        }
        if (arguments_.isStaged && end.isSuccess()) {
            isStagingOver_ = true;
            endStagedSession(*device_);
        }
        Result<SessionAftermath> aftermath = aftermathOf(*device_, end, facts_);
        if (aftermath) {
            if (end.isSuccess()) forgetFailures(aftermath->present);
            return finish(summarize(sync_.plan, facts_, *aftermath));
        }
        finish(summarizeFailed(sync_.plan, facts_, aftermath.error()));
        return int{exitStatusOf(aftermath.error())};
    }

    void watchOver(SessionWatch& watch) {
        const std::size_t count = sync_.allowed.install.size() + sync_.allowed.update.size();
        watch.onAsking([this, count] { preparation_.asked(count); });
        if (!arguments_.longestWait) return;
        watch.limitWait(*arguments_.longestWait, [this] {
            hasWaited_ = true;
            leave();
        });
    }

    // What is in step with the library, an earlier update may have failed of.
    void forgetFailures(const std::vector<ApplicationRecord>& present) {
        if (arguments_.isStaged) return;
        device_->forgetFailures(identifiersInStep(library_, present)).ignore();
    }

    // On a thread of the signals' or the watch's, whatever the session is at. From here on the plan
    // stays as it is. What the session has said at its end comes before what is said here.
    [[noreturn]] void leave() {
        if (!isPlanned_) {
            events_.closeSoon();
            leaveAtOnce(console_);
        }
        const SyncSummary summary = timed(summaryOnLeaving());
        const bool isTold = events_.finishSoon(summary);
        if (const int status = endedWith_; status >= 0) ::_exit(status);
        if (!summary.incomplete) ::_exit(kExitDone);
        // What has failed is then told, each with what to do.
        if (isStagingOver_ || hasWaited_ || (isTold && !summary.failed.empty())) {
            ::_exit(kExitSomethingFailed);
        }
        leaveAtOnce(console_);
    }

    SyncSummary summaryOnLeaving() {
        if (isDeviceTaken_.test_and_set()) return summarizeInterrupted(sync_.plan, facts_);
        const Result<SessionAftermath> aftermath = aftermathOnLeaving(*device_, facts_);
        return aftermath ? summarize(sync_.plan, facts_, *aftermath)
                         : summarizeInterrupted(sync_.plan, facts_);
    }

    SyncSummary timed(SyncSummary summary) const {
        summary.seconds = std::chrono::duration<double>(Clock::now() - begin_).count();
        summary.incomplete = summary.incomplete || !summary.failed.empty();
        return summary;
    }

    int finish(SyncSummary summary) {
        summary = timed(std::move(summary));
        for (const std::string& note : sync_.plan.notes) events_.note(note);
        endedWith_ = summary.incomplete ? kExitSomethingFailed : kExitDone;
        events_.finish(summary);
        const bool isInterrupted = summary.incomplete && signals_->stopRequested() &&
                                   !isStagingOver_ && !tellsOfInterruption(summary);
        if (isInterrupted) console_.fail(failure("interrupted", kRunAgain));
        return endedWith_;
    }

    const SyncArguments& arguments_;
    const PlugInModule& module_;
    const RecordingOrder recording_;
    const Console& console_;
    std::unique_ptr<SyncDisplay> display_;
    SyncEvents events_;
    PreparationEvents preparation_;
    SessionFacts facts_;
    std::unique_ptr<Device> device_;
    Library library_;
    SyncPreparation sync_;
    const Clock::time_point begin_ = Clock::now();
    std::atomic<bool> isPlanned_ = false;  // the plan is made, and changes no more
    // What is left of a staging area whose session has ended, the same command does not do.
    std::atomic<bool> isStagingOver_ = false;
    std::atomic<bool> hasWaited_ = false;  // for as long as it was to
    std::atomic<int> endedWith_ = -1;      // the status that the session's own end has found
    std::atomic_flag isDeviceTaken_;       // by whoever closes the device, or leaves it
    std::optional<StopSignals> signals_;   // not for a dry run
};

}  // namespace

int runSync(const SyncArguments& arguments, const Console& console) {
    const Status checked = checkSyncArguments(arguments);
    if (!checked) return console.fail(checked.error());
    const Result<PlugInModule> build = PlugInModule::open(arguments.plugIn);
    if (!build) return console.fail(build.error());
    const Result<std::unique_ptr<RecordingFile>> recording = createRecording(arguments.recording);
    if (!recording) return console.fail(recording.error());
    const Result<int> status = SyncRun(arguments, *build, recording->get(), console).run();
    if (*recording != nullptr) (*recording)->tellLoss(console);
    return status ? *status : console.fail(status.error());
}

}  // namespace appsync
