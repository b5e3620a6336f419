#include <cstddef>
#include <memory>
#include <ostream>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/sync/SyncCommands.h"
#include "host/command/sync/SyncSource.h"
#include "host/console/Console.h"
#include "host/console/LiveLine.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/output/JsonSync.h"
#include "host/plan/Library.h"
#include "host/plan/SyncPreparation.h"

namespace appsync {
namespace {

Status checkPlace(StagedWork work) {
    if (work == StagedWork::None) return {};
    return failure(
        work == StagedWork::Waiting
            ? "a staging area waits on the device already"
            : "an interrupted sync --staged has left something to do on the device",
        "do that first (appsync sync DEVICE LIBRARY --staged), or replace it with --force");
}

std::string forbiddenWarning(const SyncPreparation& sync) {
    return "as device policy is now, sync --staged skips " +
           counted(sync.forbidden, "application") + " of these: allow that first (appsync set " +
           "DEVICE " + sync.permission + ")";
}

void tell(const StageArguments& arguments, const SyncPreparation& sync, const std::string& area,
          const Console& console) {
    const SyncPlan& plan = sync.plan;
    for (const SyncFailure& each : plan.failed) {
        console.complain(each.identifier + ": " + each.error);
    }
    if (sync.forbidden > 0) console.complain(forbiddenWarning(sync));
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
                << (hasReplaced ? ", in place of what waited" : "") << "; appsync sync "
                << shellWord(arguments.sync.device) << ' ' << shellWord(arguments.sync.library)
                << " --staged does it\n";
}

Result<Library> readTold(const StageArguments& arguments, Device& device, const Console& console) {
    LiveLine line(console);
    return readSyncLibrary(
        arguments.sync, device.propertyLists(),
        [&](std::size_t done, std::size_t count) { line.say("reading packages", done, count); });
}

Result<std::string> stageTold(Device& device, const SyncPlan& plan, const Library& library,
                              const Console& console) {
    LiveLine line(console);
    return stageForLater(device, plan, library, [&](std::size_t done, std::size_t count) {
        line.say("staging", done, count);
    });
}

}  // namespace

int runStage(const StageArguments& arguments, const Console& console) {
    if (const Status usage = checkSyncArguments(arguments.sync); !usage) {
        return console.fail(usage.error());
    }
    const Result<std::unique_ptr<Device>> device =
        openDevice(arguments.sync.device, DeviceAccess::Session);
    if (!device) return console.fail(device.error());
    const Result<Library> library = readTold(arguments, **device, console);
    if (!library) return console.fail(library.error());
    Result<SyncPreparation> sync = prepareSync(**device, *library, arguments.sync.plan);
    if (!sync) return console.fail(sync.error());
    const Status isFree = arguments.replaces ? Status() : checkPlace(sync->givenUp);
    if (!isFree) return console.fail(isFree.error());
    if (!sync->space.fits()) {
        console.complain(sync->space.description());
        return kExitSomethingFailed;
    }
    const Result<std::string> staged = stageTold(**device, sync->plan, *library, console);
    if (!staged) {
        return console.fail(unusable(staged.error().withContext("cannot stage on the device")));
    }
    tell(arguments, *sync, *staged, console);
    return sync->plan.failed.empty() ? kExitDone : kExitSomethingFailed;
}

}  // namespace appsync
