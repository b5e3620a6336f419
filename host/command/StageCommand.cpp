#include <algorithm>
#include <memory>
#include <ostream>

#include "device/Device.h"
#include "host/command/Commands.h"
#include "host/command/IdentifierArgument.h"
#include "host/command/OpenDevice.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/output/JsonSync.h"
#include "host/plan/LibraryReader.h"
#include "host/plan/SyncPreparation.h"

namespace appsync {
namespace {

Status checkRemovals(const PlanOptions& options) {
    for (const std::string& identifier : options.remove) {
        if (Status legal = checkIdentifier(identifier, kGiveAsShown, "--remove"); !legal) {
            return legal;
        }
    }
    return {};
}

Status checkPlace(StagedWork work) {
    if (work == StagedWork::None) return {};
    return failure(work == StagedWork::Waiting
                       ? "a staging area waits on the device already"
                       : "an interrupted sync --staged has left something to do on the device",
                   "let appsync sync --staged do that first, or replace it with --force");
}

// A package that an interrupted session has brought is installed by the next one, whatever its area
// says, unless that removes the application.
void removeStanding(SyncPreparation& sync, const PlanOptions& options, const Library& library) {
    const bool isMirror = options.mirror && library.faults.empty();
    std::vector<std::string>& removals = sync.plan.remove;
    for (const std::string& identifier : sync.standing.obsolete) {
        const bool isUnwanted = sync.plan.absent.contains(identifier) ||
                                (isMirror && library.find(identifier) == nullptr);
        const bool isNamed = std::ranges::find(removals, identifier) != removals.end();
        if (isUnwanted && !isNamed) removals.push_back(identifier);
    }
}

void tell(const StageArguments& arguments, const SyncPreparation& sync, const std::string& area,
          const Console& console) {
    const SyncPlan& plan = sync.plan;
    for (const SyncFailure& each : plan.failed) {
        console.complain(each.identifier + ": " + each.error);
    }
    const bool hasReplaced = sync.givenUp != StagedWork::None;
    if (arguments.asJson) {
        console.out << stagedJsonText(plan, area, hasReplaced) << '\n';
        return;
    }
    for (const std::string& note : plan.notes) console.out << printable(note) << '\n';
    console.out << "staged on " << printable(arguments.sync.device) << ": "
                << counted(plan.install.size(), "install") << ", "
                << counted(plan.update.size(), "update") << ", "
                << counted(plan.remove.size(), "removal")
                << (hasReplaced ? ", in place of what waited" : "")
                << "; appsync sync --staged does it\n";
}

}  // namespace

int runStage(const StageArguments& arguments, const Console& console) {
    const PlanOptions& options = arguments.sync.plan;
    if (const Status legal = checkRemovals(options); !legal) return console.fail(legal.error());
    const Result<std::unique_ptr<Device>> device =
        openDevice(arguments.sync.device, DeviceAccess::Session);
    if (!device) return console.fail(device.error());
    const Result<Library> library = readLibrary(arguments.sync.library, (*device)->propertyLists());
    if (!library) return console.fail(library.error());
    Result<SyncPreparation> sync = prepareSync(**device, *library, options);
    if (!sync) return console.fail(sync.error());
    const Status isFree = arguments.replaces ? Status() : checkPlace(sync->givenUp);
    if (!isFree) return console.fail(isFree.error());
    if (!sync->space.fits()) {
        console.complain(sync->space.description());
        return kExitSomethingFailed;
    }
    removeStanding(*sync, options, *library);
    const Result<std::string> staged = stageForLater(**device, sync->plan, *library);
    if (!staged) {
        return console.fail(unusable(staged.error().withContext("cannot stage on the device")));
    }
    tell(arguments, *sync, *staged, console);
    return sync->plan.failed.empty() ? kExitDone : kExitSomethingFailed;
}

}  // namespace appsync
