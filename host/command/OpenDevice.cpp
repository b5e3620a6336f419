#include "host/command/OpenDevice.h"

#include <ostream>

#include <nlohmann/json.hpp>

#include "device/values/DeviceError.h"
#include "host/command/Commands.h"
#include "host/command/IdentifierArgument.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"

namespace appsync {

Result<std::unique_ptr<Device>> openDevice(const std::string& path, DeviceAccess access) {
    return openDevice(path, {.access = access});
}

Result<std::unique_ptr<Device>> openDevice(const std::string& path,
                                           const DeviceOpenOptions& options) {
    Result<std::unique_ptr<Device>> device = Device::open(path, options);
    if (!device) return unusable(device.error());
    return device;
}

ErrorRecord classified(const ErrorRecord& error) {
    return error.domain == kDeviceErrorDomain ? unusable(error) : error;
}

int lookAt(const std::string& path, const Console& console, const WorkOnDevice& look) {
    const Result<std::unique_ptr<Device>> device = openDevice(path, DeviceAccess::Look);
    if (!device) return console.fail(device.error());
    const Status status = look(**device);
    return status ? kExitDone : console.fail(classified(status.error()));
}

int actOn(const ApplicationArguments& arguments, const DeviceOpenOptions& options,
          const ActionTexts& texts, const Console& console,
          const std::function<Result<ActionOutcome>(Device& device)>& action) {
    const std::string& identifier = arguments.identifier;
    const Status checked = checkIdentifier(identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    const Result<std::unique_ptr<Device>> device = openDevice(arguments.device, options);
    if (!device) return console.fail(device.error());
    const Result<ActionOutcome> outcome = action(**device);
    if (const auto broken = (*device)->databaseFailure()) return console.fail(unusable(*broken));
    if (!outcome) return console.fail(classified(outcome.error()));
    const bool hasChanged = *outcome == ActionOutcome::Done;
    if (arguments.asJson) {
        console.out << indented({{"identifier", identifier},
                                 {"state", texts.state},
                                 {"changed", hasChanged}})
                    << '\n';
    } else {
        console.out << identifier << ' ' << (hasChanged ? texts.done : texts.wasSo) << '\n';
    }
    return kExitDone;
}

}  // namespace appsync
