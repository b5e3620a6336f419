#include <filesystem>
#include <ostream>
#include <system_error>

#include "host/Commands.h"
#include "host/Console.h"
#include "host/OpenDevice.h"
#include "host/Problem.h"

namespace appsync {
namespace {

Status checkFolder(const std::string& folder) {
    std::error_code code;
    const std::filesystem::directory_iterator iterator(folder, code);
    if (!code) return {};
    return unusable("cannot read the folder " + folder + ": " + code.message(),
                    "name a folder of packages");
}

}  // namespace

int runCoordinator(const CoordinatorArguments& arguments, const Console& console) {
    const Result<std::unique_ptr<Device>> device = openDevice(arguments.device, DeviceAccess::Look);
    if (!device) return console.fail(device.error());
    if (arguments.action != "list") {
        return console.fail(failure("coordination is off on this device",
                                    "its installs are direct, there are no coordinators"));
    }
    console.out << (arguments.asJson ? "[]\n"
                                     : "No coordinators: coordination is off on this device.\n");
    return kExitDone;
}

int runStore(const std::string& device, const std::string& folder, bool asJson,
             const Console& console) {
    const Result<std::unique_ptr<Device>> opened = openDevice(device, DeviceAccess::Look);
    if (!opened) return console.fail(opened.error());
    const Status readable = checkFolder(folder);
    if (!readable) return console.fail(readable.error());
    console.out << (asJson ? "{\n  \"kept\": [],\n  \"failed\": []\n}\n"
                           : "Nothing waits for the store.\n");
    return kExitDone;
}

}  // namespace appsync
