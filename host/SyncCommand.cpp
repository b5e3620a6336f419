#include <algorithm>
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
    SyncRun(const SyncArguments& arguments, const Console& console, const StopSignals* signals)
        : arguments_(arguments),
          console_(console),
          stopRequested_(signals != nullptr ? signals->stopRequested() : never_),
          display_(makeSyncDisplay(arguments.display, console)),
          events_(*display_) {}

    Result<int> run() {
        Status ready = prepare();
        if (!ready) return ready.error();
        if (arguments_.isDryRun) return showPlan();
        if (mustNotRun_) return refuse(plan_.failed.back().error);
        if (!space_.fits()) return refuse(space_.description());
        ready = clearTheWay();
        if (!ready) return ready.error();
        if (stopRequested_) return failure("interrupted before the session began", kRunAgain);
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
        if (!arguments_.isStaged) {
            plan_ = makePlan(library_, *present, arguments_.plan);
            return {};
        }
        const StagedTodoList staged = readStagedTodoList(*device_);
        plan_ = makeStagedPlan(staged.list, library_, *present);
        mustNotRun_ = staged.isTooLarge;
        if (staged.error) {
            plan_.failed.push_back(
                {"ApplicationsSync.plist",
                 "the todo list of the staging area cannot be used: " + *staged.error +
                     (mustNotRun_ ? "; split it, nothing was done"
                                  : "; write the staging area anew")});
        }
        return {};
    }

    Status checkSpace() {
        const Result<std::uint64_t> free = device_->freeSpace();
        if (!free) return unusable(free.error());
        const Result<DeviceSettings> settings = device_->settings();
        if (!settings) return unusable(settings.error());
        const bool removes = settings->removal != PolicyAnswer::No;
        space_ = {plan_.needed(), *free, removes ? plan_.reclaimed : 0};
        return {};
    }

    int showPlan() const {
        if (arguments_.display == SyncDisplayKind::Text) {
            console_.out << planText(plan_, space_) << std::flush;
        } else {
            console_.out << jsonText(plan_, space_) << '\n' << std::flush;
        }
        if (!space_.fits()) console_.complain(space_.description());
        return space_.fits() && plan_.failed.empty() ? kExitDone : kExitSomethingFailed;
    }

    // Nothing of the plan is done, for one reason.
    int refuse(const std::string& reason) {
        SyncSummary summary;
        summary.failed = plan_.failed;
        summary.skipped = plan_.skipped;
        for (const auto* installs : {&plan_.install, &plan_.update}) {
            for (const PlannedInstall& each : *installs) {
                summary.failed.push_back({each.identifier, reason});
            }
        }
        for (const std::string& identifier : plan_.remove) {
            summary.failed.push_back({identifier, "nothing is done: " + reason});
        }
        console_.complain(reason);
        return finish(std::move(summary));
    }

    Status clearTheWay() {
        const Result<std::vector<std::string>> placeholders =
            device_->removeLeftoverSyncPlaceholders();
        if (!placeholders) return unusable(placeholders.error());
        Status status = removeStaleTransfers(*device_);
        if (status && !arguments_.isStaged) status = writeStagingArea(*device_, plan_, library_);
        if (!status) return status.error().withContext("cannot prepare the device for the sync");
        return {};
    }

    Result<int> hold() {
        Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(*device_, events_, facts_);
        if (!plugIn) return plugIn.error();
        Session session(*device_, **plugIn, events_, facts_, stopRequested_);
        const SessionEnd end = session.sync(
            [this](const std::string& identifier) { return packageFile(library_, identifier); });
        Result<SessionAftermath> aftermath = aftermathOf(*device_, end);
        if (!aftermath) return aftermath.error();
        SyncSummary summary = summarize(plan_, facts_, *aftermath);
        summary.bytes = end.bytes;
        return finish(std::move(summary));
    }

    int finish(SyncSummary summary) {
        summary.seconds = std::chrono::duration<double>(Clock::now() - begin_).count();
        summary.incomplete = summary.incomplete || !summary.failed.empty();
        if (arguments_.display == SyncDisplayKind::Text) {
            for (const std::string& note : library_.notes) console_.out << printable(note) << '\n';
        }
        events_.finish(summary);
        if (stopRequested_) console_.fail(failure("interrupted", kRunAgain));
        return summary.incomplete ? kExitSomethingFailed : kExitDone;
    }

    const SyncArguments& arguments_;
    const Console& console_;
    const std::atomic<bool> never_ = false;
    const std::atomic<bool>& stopRequested_;
    std::unique_ptr<SyncDisplay> display_;
    SyncEvents events_;
    SessionFacts facts_;
    std::unique_ptr<Device> device_;
    Library library_;
    SyncPlan plan_;
    SpaceCheck space_;
    bool mustNotRun_ = false;
    const Clock::time_point begin_ = Clock::now();
};

}  // namespace

int runSync(const SyncArguments& arguments, const Console& console) {
    const Status checked = checkArguments(arguments);
    if (!checked) return console.fail(checked.error());
    std::optional<StopSignals> signals;
    if (!arguments.isDryRun) signals.emplace(kPatience, [&console] { leaveAtOnce(console); });
    const Result<int> status = SyncRun(arguments, console, signals ? &*signals : nullptr).run();
    return status ? *status : console.fail(status.error());
}

}  // namespace appsync
