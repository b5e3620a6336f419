#include <cstddef>
#include <memory>
#include <ostream>
#include <string>
#include <utility>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/sync/SyncCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/LiveLine.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/plan/LibraryReader.h"
#include "host/session/AppStore.h"
#include "host/session/PlugIn.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

void printKeptJson(const StoreResult& result, const Console& console) {
    Json failed = Json::array();
    for (const FailedPromise& each : result.failed) {
        failed.push_back({{"identifier", each.identifier}, {"error", each.error}});
    }
    console.out << indented({{"kept", result.kept}, {"failed", std::move(failed)}}) << '\n';
}

void printKept(const StoreResult& result, const Console& console) {
    if (result.kept.empty() && result.failed.empty()) {
        console.out << "Nothing waits for the store.\n";
        return;
    }
    for (const std::string& identifier : result.kept) {
        console.out << printable(identifier) << " is installed\n";
    }
    console.out << counted(result.kept.size(), "promise") << " kept, " << result.failed.size()
                << " failed\n";
}

Result<StoreResult> keepAllPromises(Device& device, const std::string& folder,
                                    const Console& console) {
    LiveLine line(console);
    const Result<Library> library = readLibrary(
        folder, device.propertyLists(),
        [&](std::size_t done, std::size_t count) { line.say("reading packages", done, count); });
    if (!library) return library.error();
    line.say("bringing packages");
    const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(device, console);
    if (!plugIn) return plugIn.error();
    Result<StoreResult> result = keepPromises(device, *library, (*plugIn)->platform().coordination);
    line.clear();
    if (!result) return classified(result.error());
    return result;
}

}  // namespace

int runStore(const std::string& device, const std::string& folder, bool asJson,
             const Console& console) {
    const Result<std::unique_ptr<Device>> opened = openDevice(device, DeviceAccess::Session);
    if (!opened) return console.fail(opened.error());
    const Result<StoreResult> result = keepAllPromises(**opened, folder, console);
    if (!result) return console.fail(result.error());
    for (const FailedPromise& each : result->failed) {
        console.complain(each.identifier + ": " + each.error);
    }
    (asJson ? printKeptJson : printKept)(*result, console);
    return result->failed.empty() ? kExitDone : kExitSomethingFailed;
}

}  // namespace appsync
