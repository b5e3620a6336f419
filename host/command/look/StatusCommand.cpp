#include <ostream>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/output/DeviceOverview.h"

namespace appsync {

int runStatus(const std::string& device, bool asJson, const Console& console) {
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<DeviceMoment> moment = opened.moment();
        if (!moment) return unusable(moment.error());
        const Result<DeviceOverview> overview = overviewOf(opened, *moment);
        if (!overview) return overview.error();
        const std::size_t width = console.isTerminal ? console.width : 0;
        console.out << (asJson ? jsonText(*overview) + "\n" : overviewText(*overview, width));
        return {};
    });
}

}  // namespace appsync
