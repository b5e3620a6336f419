#include "device/Device.h"
#include "host/command/Commands.h"
#include "host/command/OpenDevice.h"

namespace appsync {

int runUninstall(const std::string& device, const std::string& identifier, const Console& console) {
    return actOn(device, identifier, {.makesRoom = true}, "is uninstalled", console,
                 [&](Device& opened) { return opened.uninstall(identifier); });
}

}  // namespace appsync
