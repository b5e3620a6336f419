#include "device/Device.h"
#include "host/command/Commands.h"
#include "host/command/OpenDevice.h"

namespace appsync {

int runRun(const std::string& device, const std::string& identifier, const Console& console) {
    return actOn(device, identifier, {}, "runs", console,
                 [&](Device& opened) { return opened.run(identifier); });
}

int runQuit(const std::string& device, const std::string& identifier, const Console& console) {
    return actOn(device, identifier, {}, "does not run any more", console,
                 [&](Device& opened) { return opened.quit(identifier); });
}

}  // namespace appsync
