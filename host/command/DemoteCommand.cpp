#include "device/Device.h"
#include "host/command/Commands.h"
#include "host/command/OpenDevice.h"

namespace appsync {

int runDemote(const std::string& device, const std::string& identifier, bool bySystem,
              const Console& console) {
    const DemotedBy by = bySystem ? DemotedBy::System : DemotedBy::Person;
    const DeviceOpenOptions options{.access = DeviceAccess::Session, .makesRoom = true};
    return actOn(device, identifier, options, "is offloaded", console,
                 [&](Device& opened) { return opened.demote(identifier, by); });
}

}  // namespace appsync
