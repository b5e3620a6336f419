#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/change/ChangeCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/session/PlugIn.h"
#include "platform/SyncClient.h"

namespace appsync {

namespace {

std::vector<std::string> placeholdersOf(Device& device) {
    std::vector<std::string> identifiers;
    const Result<std::vector<ApplicationRecord>> records = device.applications();
    if (!records) return identifiers;  // the device keeps that failure
    for (const ApplicationRecord& each : *records) {
        if (each.isPlaceholder) identifiers.push_back(each.identifier);
    }
    return identifiers;
}

// Nothing but the data tells any more that there were such applications.
void tellWhoseDataStays(const std::vector<std::string>& identifiers, const Console& console) {
    if (identifiers.empty()) return;
    std::string names;
    for (const std::string& each : identifiers) {
        names += (names.empty() ? "" : ", ") + printable(each);
    }
    console.out << "The data of " << names
                << " stays: installing it again finds it, and appsync uninstall removes it.\n";
}

}  // namespace

int runReset(const std::string& device, bool asJson, const Console& console) {
    const Result<std::unique_ptr<Device>> opened =
        openDevice(device, {.access = DeviceAccess::Session, .makesRoom = true, .keepsData = true});
    if (!opened) return console.fail(opened.error());
    const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(**opened, console);
    if (!plugIn) return console.fail(plugIn.error());
    const std::vector<std::string> placeholders = placeholdersOf(**opened);
    (*plugIn)->client().clearSyncData();
    if (const auto error = (*opened)->databaseFailure()) return console.fail(unusable(*error));
    std::vector<std::string> kept;
    for (const std::string& each : placeholders) {
        if ((*opened)->hasData(each)) kept.push_back(each);
    }
    if (asJson) {
        console.out << indented({{"device", device}, {"dataKept", kept}}) << '\n';
    } else {
        console.out << printable(device) << " has forgotten what it kept for syncing\n";
        tellWhoseDataStays(kept, console);
    }
    return kExitDone;
}

}  // namespace appsync
