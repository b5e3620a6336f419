#include <chrono>
#include <cmath>
#include <ostream>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/backup/Backup.h"
#include "host/backup/Restoring.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/data/DataCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/LiveLine.h"
#include "host/console/Problem.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/module/PlugInModule.h"
#include "host/session/PlugIn.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;
using Clock = std::chrono::steady_clock;

void printJson(const RestoreArguments& arguments, const RestoreResult& result, double seconds,
               const Console& console) {
    Json failed = Json::array();
    for (const FailedRestore& each : result.failed) {
        failed.push_back({{"identifier", each.identifier}, {"error", each.error}});
    }
    Json screen = Json::array();
    for (const ShownApplication& each : result.screen) {
        screen.push_back({{"identifier", each.identifier},
                          {"name", each.name},
                          {"version", each.version ? Json(*each.version) : Json()},
                          {"state", each.isPlaceholder ? "placeholder" : "installed"}});
    }
    console.out << indented({{"type", arguments.type},
                             {"restored", result.restored},
                             {"kept", result.kept},
                             {"failed", std::move(failed)},
                             {"screen", std::move(screen)},
                             {"seconds", seconds}})
                << '\n';
}

void print(const RestoreArguments& arguments, const RestoreResult& result, double seconds,
           const Console& console) {
    if (!result.screen.empty()) {
        Table table({"IDENTIFIER", "VERSION", "NAME", "STATE"});
        table.keepEndsOf(0);
        table.spare({2, 1});
        for (const ShownApplication& each : result.screen) {
            table.add({each.identifier, each.version.value_or("-"), each.name,
                       each.isPlaceholder ? "placeholder" : "installed"});
        }
        console.out << table.textFor(console);
    }
    if (!bringsApplications(arguments.type)) {
        console.out << "a restore of type " << arguments.type << " brings no applications back\n";
        return;
    }
    console.out << counted(result.restored.size(), "application") << " restored, "
                << result.kept.size() << " kept, " << result.failed.size() << " failed in "
                << Json(std::round(seconds * 100) / 100) << " s\n";
}

int restoreWith(const PlugInModule& build, RecordingSink* recording,
                const RestoreArguments& arguments, const Console& console) {
    const Clock::time_point begin = Clock::now();
    const Result<BackupManifest> manifest = readBackupManifest(arguments.backup);
    if (!manifest) return console.fail(manifest.error());
    const Result<std::unique_ptr<Device>> device =
        openDevice(arguments.device, DeviceAccess::Session);
    if (!device) return console.fail(device.error());
    const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::loadForRestore(
        **device, console, build.table(), {recording, arguments.recording.isAnonymous});
    if (!plugIn) return console.fail(plugIn.error());
    LiveLine line(console);
    const Result<RestoreResult> result =
        restoreBackup(arguments.backup, *manifest, arguments.type, **device, **plugIn,
                      [&](const std::string& what) { line.say(what); });
    line.clear();
    if (!result) return console.fail(classified(result.error()));
    const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
    for (const FailedRestore& each : result->failed) {
        console.complain(shownArgument(each.identifier) + ": " + each.error);
    }
    (arguments.asJson ? printJson : print)(arguments, *result, seconds, console);
    return result->failed.empty() ? kExitDone : kExitSomethingFailed;
}

}  // namespace

int runRestore(const RestoreArguments& arguments, const Console& console) {
    const Result<PlugInModule> build = PlugInModule::open(arguments.plugIn);
    if (!build) return console.fail(build.error());
    const Result<std::unique_ptr<RecordingFile>> recording = createRecording(arguments.recording);
    if (!recording) return console.fail(recording.error());
    const int status = restoreWith(*build, recording->get(), arguments, console);
    if (*recording != nullptr) (*recording)->tellLoss(console);
    return status;
}

}  // namespace appsync
