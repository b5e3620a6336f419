#include <ostream>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/command/change/ChangeCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"

namespace appsync {

int runCreate(const std::string& device, bool coordination, bool asJson, const Console& console) {
    if (device.empty()) {
        return console.fail(wrongUsage("cannot create a device at ''",
                                       "it is no path of a directory; give that of a new one"));
    }
    const Status created = Device::create(device, {coordination});
    if (!created) return console.fail(unusable(created.error()));
    if (asJson) {
        console.out << indented({{"device", device}, {"coordination", coordination ? "on" : "off"}})
                    << '\n';
    } else {
        console.out << printable(device) << " is an empty device\n";
    }
    return kExitDone;
}

}  // namespace appsync
