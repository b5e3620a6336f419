#include <memory>
#include <ostream>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/command/Commands.h"
#include "host/command/OpenDevice.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/session/PlugIn.h"
#include "platform/SyncClient.h"

namespace appsync {

int runReset(const std::string& device, bool asJson, const Console& console) {
    const Result<std::unique_ptr<Device>> opened =
        openDevice(device, {.access = DeviceAccess::Session, .makesRoom = true});
    if (!opened) return console.fail(opened.error());
    const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(**opened, console);
    if (!plugIn) return console.fail(plugIn.error());
    (*plugIn)->client().clearSyncData();
    if (const auto error = (*opened)->databaseFailure()) return console.fail(unusable(*error));
    if (asJson) {
        console.out << indented({{"device", device}}) << '\n';
    } else {
        console.out << printable(device) << " has forgotten what it kept for syncing\n";
    }
    return kExitDone;
}

}  // namespace appsync
